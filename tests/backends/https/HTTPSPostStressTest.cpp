#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <thread>

#include "tests/backends/https/HTTPSFixture.h"

namespace orvanta::test {
namespace {

class HTTPSPostStressTest : public HTTPSFixture {};

// Sends, flushes and evaluations on the session's thread, relabelling and states from another session's, 5xx answers
// from the server, and in the end the backend's destruction with posts on their way.
TEST_F(HTTPSPostStressTest, EverythingAtOnce) {
  std::atomic<int> answered{0}, flushes{0}, completions{0};
  platform.http.answer = [&](const platform::HttpRequest&) {
    return ScriptedHttpClient::status(answered++ % 5 == 0 ? 503 : 200);
  };
  for (int round = 0; round < 12; ++round) {
    std::shared_ptr<HTTPSPostBackend> backend = makeBackend(requiring({}, true));
    std::atomic<bool> over{false};
    std::thread other([&over, watch = std::weak_ptr<HTTPSPostBackend>(backend)] {
      for (int i = 0; !over; ++i) {
        const auto seen = watch.lock();
        if (!seen) break;
        seen->setCorrelatedSessionID("root." + std::to_string(i));
        seen->setSamplingThreshold(0.5);
        if (i % 7 == 0) seen->setState(i % 2 == 0 ? kBackendHeld : kBackendEnabled);
        EXPECT_TRUE(seen->combinedSessionIDString().has_value());
        EXPECT_TRUE(seen->samplingThreshold().has_value());
      }
    });
    for (int i = 0; i < 300; ++i) {
      send(*backend, static_cast<std::uint16_t>(i % 3), i % 11 == 0 ? 3 : 0, shared({{"i", i}}));
      if (i % 13 == 0) backend->updateState();
      if (i % 17 == 0) {
        ++flushes;
        backend->flushMessagesWithCompletion([&](auto, auto) { ++completions; });
      }
    }
    if (round % 2 == 0) over = true;
    backend.reset();
    over = true;
    other.join();
  }
  settle();
  EXPECT_EQ(completions, flushes);
  EXPECT_GT(answered, 0);
}

// A relabelling that meets a send reaches its event: what arrives last carries the last identifier.
TEST_F(HTTPSPostStressTest, RelabellingMissesNoEvent) {
  for (int round = 0; round < 200; ++round) {
    platform.http.clear();
    const auto backend = makeBackend(batching());
    std::promise<void> go;
    std::thread other([&, started = go.get_future()]() mutable {
      started.wait();
      backend->setCorrelatedSessionID("last");
    });
    go.set_value();
    for (int i = 0; i < 8; ++i) send(*backend, 1);
    other.join();
    flush(*backend);
    ASSERT_EQ(fields("_sessionID"), Posts{"last last last last last last last last"}) << round;
  }
}

}  // namespace
}  // namespace orvanta::test
