#pragma once

#include <sys/socket.h>
#include <sys/un.h>

#include <optional>
#include <string>

namespace orvanta::platform {

// The address of the socket file at `path`; none when the path is longer than such addresses can be.
inline std::optional<sockaddr_un> unixAddress(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) return std::nullopt;
  path.copy(static_cast<char*>(address.sun_path), path.size());
  return address;
}

}  // namespace orvanta::platform
