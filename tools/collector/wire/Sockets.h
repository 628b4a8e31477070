#pragma once

#include <netinet/in.h>

#include <cstdint>
#include <string>

#include "interface/Values.h"
#include "platform/core/UniqueFd.h"

namespace orvanta::collector {

struct BoundSocket {
  platform::UniqueFd socket;
  std::uint16_t port = 0;
};

// An IPv4 socket of that type (SOCK_STREAM or SOCK_DGRAM) bound to the address; port 0 takes any free one.
Result<BoundSocket> bindSocket(int type, const std::string& address, std::uint16_t port);

// "127.0.0.1:4711".
std::string addressText(const sockaddr_in& address);

}  // namespace orvanta::collector
