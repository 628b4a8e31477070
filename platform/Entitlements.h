#pragma once

#include <string>
#include <string_view>

#include "platform/PeerIdentity.h"
#include "platform/Value.h"

namespace platform {

// Who may do what: property lists in a directory, each granting entitlement values to a "user", a "group" (name or
// number) or a security "label". Read anew at each question, so that a grant needs no restart. Nothing is granted by
// default; a file that cannot be read or makes no sense grants nothing and is logged with its reason. Thread-safe:
// holds no state but the directory's name.
class Entitlements {
 public:
  explicit Entitlements(std::string directory) : _directory(std::move(directory)) {}

  // True when any grant that matches the peer gives `entitlement` a value that reads as true.
  bool holds(const PeerIdentity& peer, std::string_view entitlement) const;

 private:
  std::string _directory;  // constant after construction
};

}  // namespace platform
