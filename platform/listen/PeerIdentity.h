#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include "platform/core/Result.h"

namespace orvanta::platform {

// The peer at the other end of a Unix socket, as the kernel knew it when it connected.
struct PeerIdentity {
  pid_t pid = 0;
  uid_t uid = 0;
  gid_t gid = 0;
  std::vector<gid_t> groups;  // supplementary groups
  std::string label;          // security label; empty without a security module
};

// From SO_PEERCRED, SO_PEERGROUPS and SO_PEERSEC. Fails only when the socket has no credentials.
Result<PeerIdentity> peerIdentityOf(int socket);

}  // namespace orvanta::platform
