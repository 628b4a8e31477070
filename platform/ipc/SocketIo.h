#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

#include "platform/core/UniqueFd.h"

namespace orvanta::platform {

// The system calls of a connected, non-blocking Unix stream socket, and the meaning of their results. They never block
// or raise SIGPIPE, and repeat themselves after EINTR.

struct Received {
  enum class Kind {
    bytes,
    nothing,    // for now
    endOfFile,  // the peer shut down its sending side, or closed
    broken,     // reset
  };
  Kind kind = Kind::nothing;
  std::size_t size = 0;          // with `bytes`
  bool descriptorsLost = false;  // with `bytes`: more came along than the process could take
};
// Descriptors that came along are appended, close-on-exec.
Received receiveBytes(int socket, std::span<std::uint8_t> buffer, std::vector<UniqueFd>& descriptors);

struct Sent {
  enum class Kind {
    some,     // at least a byte
    full,     // the socket takes more once the peer has read
    starved,  // the system lacks memory or descriptors for now; no readiness event tells when that is over
    broken,   // the peer will never take more
  };
  Kind kind = Kind::full;
  std::size_t size = 0;  // with `some`: may be less than was given
};
// With a descriptor (not -1), it goes out if any byte does.
Sent sendBytes(int socket, std::span<const std::uint8_t> bytes, int descriptor = -1);

// Returns whether nothing can pass in either direction any more: so after a peer's close(), but not after its
// shutdown() of sending.
bool hasHungUp(int socket);

}  // namespace orvanta::platform
