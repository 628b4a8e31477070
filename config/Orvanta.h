#pragma once

#include <memory>
#include <string>

#include "config/Platform.h"
#include "interface/Values.h"
#include "platform/core/Mutex.h"
#include "platform/host/Digest.h"

namespace orvanta {

// The client framework as installed on the device: its version, its verification key and the persistent identifiers
// that it hands out. Owned by ConfigServices, which makes it on first use; reads its files then, the key on each
// request for it until it has one. Thread-safe.
class Orvanta {
 public:
  explicit Orvanta(Platform& platform);

  // framework.plist's "version", or "8.0" when it has no version.
  const std::string& bundleVersion() const { return _version; }
  // The resource publicKey.der; null when it is missing or not an RSA key.
  std::shared_ptr<const platform::RsaPublicKey> publicKey();
  // The same, with the reason.
  Result<std::shared_ptr<const platform::RsaPublicKey>> readPublicKey();
  // A random UUID's text kept in the user defaults: one for devices whose consent is respected, another for reports
  // that override it, so that the two can never be joined.
  std::string getPersistentIdentifierForDNU(bool respectConsent);

 private:
  Platform& _platform;
  std::string _version;  // constant after construction
  platform::Mutex _mutex;
  std::shared_ptr<const platform::RsaPublicKey> _key GUARDED_BY(_mutex);
};

}  // namespace orvanta
