#include "platform/listen/PeerIdentity.h"

#include <sys/socket.h>

#include <cerrno>

#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {

constexpr uid_t kNoUser = static_cast<uid_t>(-1);  // reported by a socket without a peer

// A socket option whose size only the kernel knows; empty when the kernel has no value.
template <class Container>
Container optionOf(int socket, int option, std::size_t expected) {
  using Element = typename Container::value_type;
  Container content(expected, Element{});
  for (int attempt = 0; attempt < 4; ++attempt) {
    auto size = static_cast<socklen_t>(content.size() * sizeof(Element));
    const int result = ::getsockopt(socket, SOL_SOCKET, option, content.data(), &size);
    if (result != 0 && errno != ERANGE) return {};
    content.resize(size / sizeof(Element));  // with ERANGE: the size that it needs
    if (result == 0) return content;
  }
  return {};
}

}  // namespace

Result<PeerIdentity> peerIdentityOf(int socket) {
  ucred credentials{};
  socklen_t size = sizeof credentials;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) {
    return Failure{"The socket has no peer credentials: " + errnoText(errno)};
  }
  if (credentials.uid == kNoUser)
    return Failure{"The socket has no peer credentials: It is not connected to a process"};

  PeerIdentity peer;
  peer.pid = credentials.pid;
  peer.uid = credentials.uid;
  peer.gid = credentials.gid;
  peer.groups = optionOf<std::vector<gid_t>>(socket, SO_PEERGROUPS, 32);
  peer.label = optionOf<std::string>(socket, SO_PEERSEC, 128);
  while (!peer.label.empty() && (peer.label.back() == '\0' || peer.label.back() == '\n')) peer.label.pop_back();
  return peer;
}

}  // namespace orvanta::platform
