#pragma once

#include <map>
#include <string>
#include <string_view>

#include "platform/core/Mutex.h"
#include "platform/core/Value.h"
#include "platform/listen/PeerIdentity.h"

namespace orvanta::platform {

// Says which peer may do what, from property lists in a directory, each granting entitlement values to a "user", a
// "group" (name or number) or a security "label". Read anew at each question, so that a grant needs no restart. Nothing
// is granted by default; a file that cannot be read or is invalid grants nothing and is logged with its reason, once
// until that changes. Thread-safe.
class Entitlements {
 public:
  explicit Entitlements(std::string directory) : _directory(std::move(directory)) {}

  // True when any grant that matches the peer gives `entitlement` a value that reads as true.
  bool holds(const PeerIdentity& peer, std::string_view entitlement);
  // True when some grant gives it, to any peer at all. Logs, as a warning, other entitlements that are granted: nothing
  // asks for them.
  bool isHeldByAnybody(std::string_view entitlement);

 private:
  // With a null `peer`: by any grant.
  bool isGranted(const PeerIdentity* peer, std::string_view entitlement);
  void tell(const std::string& path, const std::string& problem);

  const std::string _directory;
  Mutex _mutex;
  std::map<std::string, std::string> _problems GUARDED_BY(_mutex);  // by file: the last one logged
};

}  // namespace orvanta::platform
