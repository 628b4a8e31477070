#include "config/Orvanta.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <optional>
#include <utility>
#include <vector>

#include "config/UserDefaultKeys.h"
#include "interface/OrvantaLogging.h"
#include "platform/codec/PropertyList.h"
#include "platform/core/Text.h"
#include "platform/core/UniqueFd.h"

namespace orvanta {

namespace {

constexpr const char* kVersionWithoutBundle = "8.0";
constexpr std::size_t kLargestKeyFile = 64U << 10U;  // a 16,384-bit key takes 2 KiB

std::string readVersion(const std::string& frameworkDirectory) {
  const std::string path = frameworkDirectory + "/framework.plist";
  if (::access(path.c_str(), F_OK) != 0 && errno == ENOENT) return kVersionWithoutBundle;
  const auto bundle = platform::readPropertyListFile(path);
  if (!bundle) {
    ORVANTA_LOG(warning, "bundleVersion: {}; version {} is used", bundle.error(), kVersionWithoutBundle);
    return kVersionWithoutBundle;
  }
  const Dictionary* content = bundle->dictionary();
  if (content == nullptr) {
    ORVANTA_LOG(warning, "bundleVersion: {} is no dictionary; version {} is used", path, kVersionWithoutBundle);
    return kVersionWithoutBundle;
  }
  static constexpr std::string_view kKeys[] = {"version"};
  if (const std::string unknown = platform::describeUnknownKeys(*content, kKeys); !unknown.empty()) {
    ORVANTA_LOG(warning, "bundleVersion: {} in {}", unknown, path);
  }
  const Value* version = content->find("version");
  if (version == nullptr) return kVersionWithoutBundle;
  if (const std::string* text = version->string()) return *text;
  if (version->isNumber()) return version->description();
  ORVANTA_LOG(warning, "bundleVersion: \"version\" in {} is no text; version {} is used", path, kVersionWithoutBundle);
  return kVersionWithoutBundle;
}

// The key file's bytes, or what keeps them from being read.
Result<std::vector<std::uint8_t>> readKeyFile(const std::string& path) {
  const platform::UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  if (!file) return Failure{"cannot open " + path + ": " + platform::errnoText(errno)};
  std::vector<std::uint8_t> bytes(kLargestKeyFile);
  const ssize_t count = ::read(file.get(), bytes.data(), bytes.size());
  if (count < 0) return Failure{"cannot read " + path + ": " + platform::errnoText(errno)};
  bytes.resize(static_cast<std::size_t>(count));
  return bytes;
}

}  // namespace

Orvanta::Orvanta(Platform& platform)
    : _platform(platform), _version(readVersion(platform.files().frameworkDirectory)) {}

std::shared_ptr<const platform::RsaPublicKey> Orvanta::publicKey() {
  const auto key = readPublicKey();
  if (key) return *key;
  ORVANTA_LOG(debug, "publicKey: {}", key.error());
  return nullptr;
}

Result<std::shared_ptr<const platform::RsaPublicKey>> Orvanta::readPublicKey() {
  const platform::MutexLock lock(_mutex);
  if (_key) return _key;
  const std::string path = _platform.files().frameworkDirectory + "/publicKey.der";
  const auto bytes = readKeyFile(path);
  if (!bytes) return Failure{bytes.error()};
  _key = platform::RsaPublicKey::fromDer(*bytes);
  if (!_key) return Failure{path + " holds no RSA public key"};
  return _key;
}

std::string Orvanta::getPersistentIdentifierForDNU(bool respectConsent) {
  Value value = _platform.defaults().valueOrStore(respectConsent ? kRespectConsentKey : kOverrideConsentKey,
                                                  [] { return Value(platform::uuidText(platform::randomUuid())); });
  return value.string() != nullptr ? std::move(*value.string()) : value.description();
}

}  // namespace orvanta
