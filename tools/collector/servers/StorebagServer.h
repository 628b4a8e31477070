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
  // Seconds, in Cache-Control; none: no such header. With `maxAgeOfBag` it is the bag's refresh_cycle that goes there,
  // and this only for a bag that has none: daemons take refresh_cycle from a bag that arrives, but after an answer that
  // nothing has changed they go by the header, and an edit should reach them as soon then.
  std::optional<std::int64_t> maxAge = 3600;
  bool maxAgeOfBag = true;
  bool lastModified = true;  // whether answers carry Last-Modified
};

// The bag that a new directory gets, as JSON with placeholders.
std::string_view defaultStorebagJson();

// What "${http}" and the like in a bag's texts stand for.
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
// storebag.json or storebag.plist, is signed, and carries the file's time as Last-Modified. Files are read again when
// they change. Thread-safe.
class StorebagServer {
 public:
  // Makes storebag.json when the directory has no bag, the signing key when there is none, and the public key files.
  static Result<std::unique_ptr<StorebagServer>> make(const std::string& directory);

  void setPlaceholders(BagPlaceholders placeholders);  // before the first answer
  void setSettings(const StorebagSettings& settings);
  StorebagSettings settings() const;
  // Serves this bag instead of files: for that name, or for all names without one of their own when it is empty.
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
  // A Last-Modified time that differs from that of every earlier content.
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
