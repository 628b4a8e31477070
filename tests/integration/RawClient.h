#pragma once

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <utility>

#include "platform/Connect.h"
#include "tests/support/Peer.h"

namespace orvanta::test {

// A client that speaks bytes, as good or as bad as a test wants.
class RawClient : public Peer {
 public:
  explicit RawClient(const std::string& directory) : Peer(connectedTo(directory)) {}
  // The next answer; none at the end.
  std::optional<platform::Frame> answer() { return nextFrame(); }

 private:
  static platform::UniqueFd connectedTo(const std::string& directory) {
    auto socket = platform::connectToService(directory, "com.kovalt.orvantad");
    EXPECT_TRUE(socket) << socket.error();
    return socket ? std::move(*socket) : platform::UniqueFd();
  }
};

}  // namespace orvanta::test
