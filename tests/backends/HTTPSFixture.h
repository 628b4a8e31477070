#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/HTTPSPostBackend.h"
#include "platform/Value.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta::test {

using platform::Array;
using platform::Dictionary;
using platform::Value;

inline SharedDictionary shared(Dictionary dictionary) {
  return std::make_shared<const Dictionary>(std::move(dictionary));
}

std::string gunzip(const std::string& bytes);
// The body as it was before compression.
std::string plainBody(const platform::HttpRequest& request);
// The events of a posted envelope; fails the test when the body is none.
Array postedEvents(const platform::HttpRequest& request);
std::string headerOf(const platform::HttpRequest& request, std::string_view name);

// What a flush told its caller.
struct FlushAnswer {
  int calls = 0;
  std::optional<std::string> text;
  std::optional<OrvantaError> error;
};

// A platform, and HTTPS backends as a session would make and drive them.
class HTTPSFixture : public ::testing::Test {
 protected:
  static constexpr std::chrono::seconds kHangGuard{30};

  // A section under which everything reports: any client, any country known, no filters that match.
  static Dictionary openSection();
  static Dictionary profileOf(Array sections) { return {{"clients", std::move(sections)}}; }

  struct Setup {
    Dictionary profile = profileOf({Value(openSection())});
    BackendIdentity identity = defaultIdentity();
    bool batchEvents = false;
    SharedDictionary userInfo;
    std::string name = "http_post";
    double samplingFactor = 0.0;
    bool evaluate = true;
  };
  // One that batches.
  static Setup batching() {
    Setup setup;
    setup.batchEvents = true;
    return setup;
  }
  static BackendIdentity defaultIdentity();
  std::shared_ptr<HTTPSPostBackend> makeBackend(const Setup& setup);

  // One event at the clock's time.
  std::optional<std::string> send(OrvantaBackend& backend, std::uint16_t method, std::int32_t flag = 0,
                                  SharedDictionary payload = nullptr, std::uint16_t respCode = 1);
  // Flushes and, once every post has ended, gives what the completion got.
  FlushAnswer flush(HTTPSPostBackend& backend);
  // Waits until every post has been handed to the HTTP client (which answers at once unless it holds).
  void settle();
  std::vector<platform::HttpRequest> requests();
  // The categories of each post so far, as "1 2 3".
  using Posts = std::vector<std::string>;
  Posts categories();

  TestPlatform platform;
};

}  // namespace orvanta::test
