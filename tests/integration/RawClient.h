#pragma once

#include <optional>
#include <string>
#include <utility>

#include "platform/ipc/Connect.h"
#include "tests/support/Peer.h"

namespace orvanta::test {

// A client that speaks bytes, as good or as bad as a test wants.
struct RawClient : Peer {
  explicit RawClient(const std::string& directory)
      : Peer(std::move(platform::connectToService(directory, "com.kovalt.orvantad").value())) {}
  // The next answer; nullopt at the end.
  std::optional<platform::Frame> answer() { return nextFrame(); }
};

}  // namespace orvanta::test
