#pragma once

#include <sys/socket.h>
#include <sys/un.h>

#include <optional>
#include <string>

#include "platform/core/Result.h"
#include "platform/core/UniqueFd.h"

namespace orvanta::platform {

// The address of the socket file at `path`; nullopt when the path is longer than such addresses can be.
inline std::optional<sockaddr_un> unixAddress(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) return std::nullopt;
  path.copy(static_cast<char*>(address.sun_path), path.size());
  return address;
}

// Connects to the named service whose socket lies in `directory`: the client's counterpart of Listener. Does not block;
// the socket is non-blocking and close-on-exec. Any thread.
//
// On failure `*errorNumber`, where given, tells apart what the text only says: ENOENT (no such socket: nothing runs
// there), ECONNREFUSED (a socket file without a listener), EACCES, EAGAIN (the service has too many waiting),
// ENAMETOOLONG. It is 0 on success.
Result<UniqueFd> connectToService(const std::string& directory, const std::string& service, int* errorNumber = nullptr);

}  // namespace orvanta::platform
