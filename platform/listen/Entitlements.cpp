#include "platform/listen/Entitlements.h"

#include <grp.h>
#include <pwd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <filesystem>
#include <limits>
#include <memory>
#include <optional>
#include <system_error>
#include <utility>
#include <vector>

#include "platform/codec/PropertyList.h"
#include "platform/core/Log.h"
#include "platform/core/Text.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta::platform {

namespace {

constexpr std::size_t kMaximumFileSize = 1U << 20U;

// The number of a user or group given by name, through the system's name services, which may ask over a network.
template <class Record, class Lookup>
Result<const Record*> lookUp(Lookup lookup, const std::string& name, Record& record, std::vector<char>& buffer) {
  const BlockingScope blocking;
  Record* found = nullptr;
  int error = ERANGE;
  for (buffer.resize(1024); (error = lookup(name.c_str(), &record, buffer.data(), buffer.size(), &found)) == ERANGE;) {
    buffer.resize(buffer.size() * 4);
  }
  if (found != nullptr) return found;
  if (error == 0) return Failure{"there is no \"" + name + "\""};
  return Failure{"\"" + name + "\" cannot be looked up: " + errnoText(error)};
}

Result<std::uint32_t> userNumber(const std::string& name) {
  passwd record{};
  std::vector<char> buffer;
  const auto found = lookUp(::getpwnam_r, name, record, buffer);
  if (!found) return Failure{found.error()};
  return (*found)->pw_uid;
}

Result<std::uint32_t> groupNumber(const std::string& name) {
  group record{};
  std::vector<char> buffer;
  const auto found = lookUp(::getgrnam_r, name, record, buffer);
  if (!found) return Failure{found.error()};
  return (*found)->gr_gid;
}

// A number, or a text that is a number or a name. The largest number stands for no user to the kernel.
Result<std::uint32_t> identityNumber(const Value& value, Result<std::uint32_t> (*byName)(const std::string&)) {
  constexpr std::uint32_t kNone = std::numeric_limits<std::uint32_t>::max();
  if (const auto* const number = std::get_if<std::int64_t>(&value.storage())) {
    if (*number < 0 || *number >= kNone) return Failure{"a number that is out of range"};
    return static_cast<std::uint32_t>(*number);
  }
  const std::string* const text = value.string();
  if (text == nullptr || text->empty()) return Failure{"neither a name nor a number"};
  if (!std::all_of(text->begin(), text->end(), [](char c) { return c >= '0' && c <= '9'; })) return byName(*text);
  std::uint32_t number = kNone;
  std::from_chars(text->data(), text->data() + text->size(), number);
  if (number == kNone) return Failure{"a number that is out of range"};
  return number;
}

struct Grant {
  bool matches = false;  // the peer in question, or any
  const Dictionary* entitlements = nullptr;
};

Result<Grant> readGrant(const Value& file, const PeerIdentity* peer) {
  const Dictionary* const content = file.dictionary();
  if (content == nullptr) return Failure{"it holds no dictionary"};
  static constexpr std::string_view kKeys[] = {"user", "group", "label", "entitlements"};
  if (std::string unknown = describeUnknownKeys(*content, kKeys); !unknown.empty()) return Failure{std::move(unknown)};
  Grant grant;
  int subjects = 0;
  for (const auto& [key, value] : *content) {
    Result<std::uint32_t> number = 0U;
    if (key == "entitlements") {
      grant.entitlements = value.dictionary();
      if (grant.entitlements == nullptr) return Failure{"\"entitlements\" is no dictionary"};
      continue;
    }
    ++subjects;
    if (key == "user") {
      number = identityNumber(value, userNumber);
      grant.matches = number && (peer == nullptr || *number == peer->uid);
    } else if (key == "group") {
      number = identityNumber(value, groupNumber);
      grant.matches = number && (peer == nullptr || *number == peer->gid ||
                                 std::find(peer->groups.begin(), peer->groups.end(), *number) != peer->groups.end());
    } else {
      // An empty label would be that of every process where no security module runs.
      if (value.string() == nullptr || value.string()->empty()) return Failure{"\"label\" is no text"};
      grant.matches = peer == nullptr || *value.string() == peer->label;
    }
    if (!number) return Failure{"\"" + key + "\" is wrong: " + number.error()};
  }
  if (subjects != 1) return Failure{"it needs exactly one of \"user\", \"group\" and \"label\""};
  if (grant.entitlements == nullptr) return Failure{"\"entitlements\" is missing"};
  return grant;
}

// The directory's property lists in the order of their names.
std::vector<std::string> grantFiles(const std::string& directory) {
  std::vector<std::string> files;
  std::error_code error;
  for (std::filesystem::directory_iterator entry(directory, error), end; !error && entry != end;
       entry.increment(error)) {
    const std::filesystem::path& path = entry->path();
    // Hidden files are what editors and package managers leave while they write.
    if (path.extension() == ".plist" && path.filename().native().front() != '.') files.push_back(path.string());
  }
  if (error) PLATFORM_LOG(notice, "Entitlements: {} cannot be read: {}", directory, error.message());
  std::sort(files.begin(), files.end());
  return files;
}

}  // namespace

bool Entitlements::holds(const PeerIdentity& peer, std::string_view entitlement) {
  return isGranted(&peer, entitlement);
}

bool Entitlements::isHeldByAnybody(std::string_view entitlement) {
  return isGranted(nullptr, entitlement);
}

bool Entitlements::isGranted(const PeerIdentity* peer, std::string_view entitlement) {
  PropertyListLimits limits;
  limits.maximumBytes = kMaximumFileSize;
  bool held = false;
  for (const std::string& path : grantFiles(_directory)) {
    const Result<Value> file = readPropertyListFile(path, limits);
    if (!file) {
      tell(path, file.error());
      continue;
    }
    const Result<Grant> grant = readGrant(*file, peer);
    tell(path, grant ? std::string() : path + " grants nothing: " + grant.error());
    if (!grant || !grant->matches) continue;
    if (peer == nullptr) {
      const std::string unknown = describeUnknownKeys(*grant->entitlements, {&entitlement, 1});
      if (!unknown.empty()) PLATFORM_LOG(warning, "Entitlements: {} in {}", unknown, path);
    }
    const Value* const value = grant->entitlements->find(entitlement);
    held = held || (value != nullptr && value->booleanReading().value_or(false));
  }
  return held;
}

// Any process may connect as often as it likes: that must not fill the log.
void Entitlements::tell(const std::string& path, const std::string& problem) {
  {
    const MutexLock lock(_mutex);
    std::string& told = _problems[path];
    if (told == problem) return;
    told = problem;
  }
  if (!problem.empty()) PLATFORM_LOG(warning, "Entitlements: {}", problem);
}

}  // namespace orvanta::platform
