#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "interface/Values.h"
#include "platform/core/Mutex.h"
#include "tools/collector/store/ReceivedRecords.h"
#include "tools/storebag/StorebagFile.h"

namespace orvanta::collector {

struct StorebagSettings {
  PropertyListForm container = PropertyListForm::xml;
  PropertyListForm bag = PropertyListForm::xml;
  // Seconds, in Cache-Control; nullopt leaves the header out. With `maxAgeOfBag` the bag's refresh_cycle goes there,
  // and this only for a bag that lacks one: daemons take refresh_cycle from a bag that they receive, but after "not
  // modified" they go by the header, and an edit should reach them as soon then.
  std::optional<std::int64_t> maxAge = 3600;
  bool maxAgeOfBag = true;
  bool lastModified = true;  // answers carry Last-Modified
};

// The bag that a new directory gets, as JSON with placeholders.
std::string_view defaultStorebagJson();

// The values for "${http}" and the like in a bag's strings.
struct BagPlaceholders {
  std::string http;   // http://127.0.0.1:PORT
  std::string https;  // https://localhost:PORT
  std::uint16_t dashboardPort = 0;
};
Value fillPlaceholders(const Value& value, const BagPlaceholders& placeholders);

struct HttpAnswer {
  int status = 200;
  HeaderFields headers;
  std::string contentType;
  std::string body;
};

// Answers requests for storebags: the bag NAME comes from NAME.json or NAME.plist in the directory, or else from
// storebag.json or storebag.plist, is signed, and carries the file's time as Last-Modified. Reads the file for each
// answer; a broken one is answered 500 with the reason. Owned by the collector. Thread-safe.
class StorebagServer {
 public:
  // Makes storebag.json if the directory has no bag, the signing key if it is missing, and the public key files. A
  // failure names the file.
  static Result<std::unique_ptr<StorebagServer>> make(const std::string& directory);

  void setPlaceholders(BagPlaceholders placeholders);  // before the first answer
  void setSettings(const StorebagSettings& settings);
  StorebagSettings settings() const;
  // Serves this bag instead of files: for that name or, if the name is empty, for all names without a bag of
  // their own.
  void setBag(const std::string& name, Value inner);
  void clearBags();

  HttpAnswer answer(const std::string& name, const std::string* ifModifiedSince);
  std::string publicKeyFile() const { return _directory + "/publicKey.der"; }
  // The same key as a PKCS#1 structure.
  std::string publicKeyPkcs1File() const { return _directory + "/publicKey.pkcs1.der"; }

 private:
  struct Source;
  StorebagServer(std::string directory, std::shared_ptr<const SigningKey> key);
  Result<Source> sourceFor(const std::string& name) const;
  // Returns a Last-Modified time that differs from that of every earlier content.
  std::int64_t stampFor(const std::string& identity, std::int64_t modifiedNanoseconds);

  // Constant after construction (the placeholders: after set-up).
  const std::string _directory;
  const std::shared_ptr<const SigningKey> _key;
  BagPlaceholders _placeholders;

  struct Stamp {
    std::int64_t modifiedNanoseconds = 0;
    std::int64_t stamp = 0;
  };
  struct HeldBag {
    Value inner;
    std::int64_t modifiedNanoseconds = 0;
  };
  mutable platform::Mutex _mutex;
  StorebagSettings _settings GUARDED_BY(_mutex);
  std::map<std::string, HeldBag> _held GUARDED_BY(_mutex);
  std::map<std::string, Stamp> _stamps GUARDED_BY(_mutex);  // by file or held name, which the directory bounds
};

}  // namespace orvanta::collector
