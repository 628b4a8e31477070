#include "platform/host/DeviceProperties.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <ctime>
#include <initializer_list>
#include <string_view>
#include <vector>

#include <fmt/format.h>

#include "platform/codec/PropertyList.h"
#include "platform/core/FileStamp.h"
#include "platform/core/Log.h"
#include "platform/core/Mutex.h"
#include "platform/core/Text.h"
#include "platform/host/SystemFacts.h"

namespace orvanta::platform {

namespace {

constexpr std::size_t kMaximumPropertyListBytes = 1U << 20U;
constexpr std::size_t kMaximumSystemFileBytes = 64U << 10U;
constexpr std::size_t kMaximumIdentifierLength = 40;

constexpr std::array<std::string_view, 9> kTextKeys{"UniqueDeviceID", "ProductVersion", "BuildVersion",
                                                    "HardwareModel",  "SerialNumber",   "ProductType",
                                                    "DeviceName",     "ReleaseType",    "CountryCode"};
constexpr std::array<std::string_view, 2> kBooleanKeys{"AutomaticTimeZone", "DiagnosticsSubmissionAllowed"};

template <std::size_t Count>
bool contains(const std::array<std::string_view, Count>& keys, std::string_view key) {
  return std::find(keys.begin(), keys.end(), key) != keys.end();
}

// The valid part of a device.plist, with remarks on the rest: a misspelt key or a wrong type would else look like a
// setting that has no effect.
Dictionary understood(const Dictionary& content, const std::string& path, std::vector<std::string>& remarks) {
  Dictionary result;
  for (const auto& [key, value] : content) {
    if (contains(kTextKeys, key) ? value.string() != nullptr : contains(kBooleanKeys, key) && value.isBool()) {
      result.set(key, value);
    } else if (contains(kTextKeys, key) || contains(kBooleanKeys, key)) {
      remarks.push_back(fmt::format("{} is not a {} in {} and does not count", key,
                                    contains(kTextKeys, key) ? "string" : "boolean", path));
    } else {
      std::vector<std::string_view> known(kTextKeys.begin(), kTextKeys.end());
      known.insert(known.end(), kBooleanKeys.begin(), kBooleanKeys.end());
      remarks.push_back(fmt::format("unknown key {} in {}, did you mean {}?", key, path, nearestWord(key, known)));
    }
  }
  return result;
}

}  // namespace

struct LinuxDeviceProperties::State {
  State(std::string configurationDirectory, std::string applicationName, std::string root)
      : path(std::move(configurationDirectory) + "/device.plist"),
        application(std::move(applicationName)),
        systemRoot(std::move(root)),
        country(countryOfEnvironment()) {}

  std::optional<std::string> text(std::string_view key);
  std::optional<bool> boolean(std::string_view key);

  // A file of the system; nullopt when it does not exist or we may not read it (serial numbers are often for root
  // only).
  std::optional<std::string> systemFile(const char* name) const;
  std::optional<std::string> osRelease(std::string_view key) const;
  // The first of these files that holds something of use.
  std::optional<std::string> firmware(std::initializer_list<const char*> names) const;

  const std::string path;
  const std::string application;
  const std::string systemRoot;
  const std::optional<std::string> country;

 private:
  const Dictionary& current() REQUIRES(_mutex);
  void reject(const FileStamp& stamp, const std::string& problem) REQUIRES(_mutex);

  Mutex _mutex;
  Dictionary _content GUARDED_BY(_mutex);
  FileStamp _stamp GUARDED_BY(_mutex);                   // of the file that _content came from
  std::string _problem GUARDED_BY(_mutex);               // the last one logged, until the file reads well again
  std::vector<std::string> _remarks GUARDED_BY(_mutex);  // on what the file last held, logged
};

const Dictionary& LinuxDeviceProperties::State::current() {
  if (_stamp.stillHolds(FileStamp::of(path))) return _content;
  auto file = readStamped(path, kMaximumPropertyListBytes);
  _content = Dictionary();
  if (!file) {
    reject({}, file.error());
    return _content;
  }
  if (file->stamp.exists) {
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(file->bytes.data());
    const auto parsed = parsePropertyList({bytes, file->bytes.size()});
    if (!parsed || parsed->dictionary() == nullptr) {
      reject(file->stamp, path + " counts as empty: " + (parsed ? "it is not a dictionary" : parsed.error()));
      return _content;
    }
    std::vector<std::string> remarks;
    _content = understood(*parsed->dictionary(), path, remarks);
    for (const std::string& remark : remarks) {
      if (std::find(_remarks.begin(), _remarks.end(), remark) == _remarks.end()) {
        PLATFORM_LOG(warning, "DeviceProperties: {}", remark);
      }
    }
    _remarks = std::move(remarks);
  }
  _stamp = file->stamp;
  _problem.clear();
  return _content;
}

void LinuxDeviceProperties::State::reject(const FileStamp& stamp, const std::string& problem) {
  _stamp = stamp;
  if (problem == _problem) return;
  _problem = problem;
  PLATFORM_LOG(error, "DeviceProperties: {}", problem);
}

std::optional<std::string> LinuxDeviceProperties::State::text(std::string_view key) {
  const MutexLock lock(_mutex);
  if (const std::string* text = current().text(key)) return *text;
  return std::nullopt;
}

std::optional<bool> LinuxDeviceProperties::State::boolean(std::string_view key) {
  const MutexLock lock(_mutex);
  const Value* value = current().find(key);
  if (value == nullptr) return std::nullopt;
  return value->boolValue();
}

std::optional<std::string> LinuxDeviceProperties::State::systemFile(const char* name) const {
  auto file = readStamped(systemRoot + name, kMaximumSystemFileBytes);
  if (!file) {
    PLATFORM_LOG(debug, "DeviceProperties: {}", file.error());
    return std::nullopt;
  }
  if (!file->stamp.exists) return std::nullopt;
  return std::move(file->bytes);
}

std::optional<std::string> LinuxDeviceProperties::State::osRelease(std::string_view key) const {
  for (const char* name : {"/etc/os-release", "/usr/lib/os-release"}) {
    if (const auto content = systemFile(name)) return osReleaseValue(*content, key);
  }
  return std::nullopt;
}

std::optional<std::string> LinuxDeviceProperties::State::firmware(std::initializer_list<const char*> names) const {
  for (const char* name : names) {
    if (const auto content = systemFile(name)) {
      if (auto fact = firmwareText(*content)) return fact;
    }
  }
  return std::nullopt;
}

LinuxDeviceProperties::LinuxDeviceProperties(std::string configurationDirectory, std::string application,
                                             std::string systemRoot)
    : _state(
          std::make_unique<State>(std::move(configurationDirectory), std::move(application), std::move(systemRoot))) {}

LinuxDeviceProperties::~LinuxDeviceProperties() = default;

std::optional<std::string> LinuxDeviceProperties::uniqueDeviceID() const {
  if (auto given = _state->text("UniqueDeviceID")) {
    std::size_t length = std::min(given->size(), kMaximumIdentifierLength);
    while (length < given->size() && length > 0 && (static_cast<unsigned char>((*given)[length]) & 0xc0U) == 0x80U) {
      --length;  // not in the middle of a character
    }
    given->resize(length);
    return given;
  }
  const auto machineId = _state->systemFile("/etc/machine-id");
  return machineId ? deriveDeviceIdentifier(*machineId, _state->application) : std::nullopt;
}

std::optional<std::string> LinuxDeviceProperties::productVersion() const {
  if (auto given = _state->text("ProductVersion")) return given;
  return _state->osRelease("VERSION_ID");
}

std::optional<std::string> LinuxDeviceProperties::buildVersion() const {
  if (auto given = _state->text("BuildVersion")) return given;
  if (auto build = _state->osRelease("BUILD_ID")) return build;
  return _state->osRelease("IMAGE_VERSION");
}

std::optional<std::string> LinuxDeviceProperties::hardwareModel() const {
  if (auto given = _state->text("HardwareModel")) return given;
  return _state->firmware({"/sys/class/dmi/id/product_name", "/proc/device-tree/model"});
}

std::optional<std::string> LinuxDeviceProperties::serialNumber() const {
  if (auto given = _state->text("SerialNumber")) return given;
  return _state->firmware({"/sys/class/dmi/id/product_serial", "/proc/device-tree/serial-number"});
}

// The first "compatible" text of a device tree is what names the type for programs.
std::optional<std::string> LinuxDeviceProperties::productType() const {
  if (auto given = _state->text("ProductType")) return given;
  return _state->firmware(
      {"/sys/class/dmi/id/product_name", "/proc/device-tree/compatible", "/proc/device-tree/model"});
}

std::optional<std::string> LinuxDeviceProperties::deviceName() const {
  if (auto given = _state->text("DeviceName")) return given;
  return _state->firmware({"/sys/class/dmi/id/product_family"});
}

std::optional<std::string> LinuxDeviceProperties::releaseType() const {
  return _state->text("ReleaseType");
}

std::optional<std::string> LinuxDeviceProperties::countryCode() const {
  if (auto given = _state->text("CountryCode")) return given;
  return _state->country;
}

std::optional<bool> LinuxDeviceProperties::automaticTimeZone() const {
  return _state->boolean("AutomaticTimeZone");
}

bool LinuxDeviceProperties::diagnosticsSubmissionAllowed() const {
  return _state->boolean("DiagnosticsSubmissionAllowed").value_or(false);
}

// tzset() looks at /etc/localtime's inode and time, one system call, and reads it only when they have changed;
// localtime_r() alone would keep the zone that it saw first. The zone is the process's, and so is the lock: the C
// library has one of its own, which thread checkers cannot see. Every event asks, so that a thread remembers the answer
// for as long as the clock shows the same second.
int LinuxDeviceProperties::timeZoneOffset(double wallSeconds) const {
  if (!(std::abs(wallSeconds) < 1e15)) return 0;
  const auto seconds = static_cast<std::time_t>(std::floor(wallSeconds));
  struct Answer {
    std::time_t seconds = 0;
    std::optional<int> offset;
  };
  thread_local Answer last;
  if (last.offset && last.seconds == seconds) return *last.offset;
  std::tm local{};
  static Mutex zoneMutex;
  const MutexLock lock(zoneMutex);
  ::tzset();
  last = {seconds, ::localtime_r(&seconds, &local) != nullptr ? static_cast<int>(local.tm_gmtoff) : 0};
  return *last.offset;
}

}  // namespace orvanta::platform
