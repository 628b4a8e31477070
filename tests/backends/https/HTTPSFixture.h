#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/https/HTTPSPostBackend.h"
#include "interface/Values.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta::test {

inline SharedDictionary shared(Dictionary dictionary) {
  return std::make_shared<const Dictionary>(std::move(dictionary));
}

std::string gunzip(const std::string& bytes);
// The body as it was before compression.
std::string plainBody(const platform::HttpRequest& request);
// The posted envelope, and its events; empty, with a failure, when the body does not parse.
Dictionary envelopeOf(const platform::HttpRequest& request);
std::vector<Dictionary> postedEvents(const platform::HttpRequest& request);
std::string headerOf(const platform::HttpRequest& request, std::string_view name);

using TestBackends = TestServices<BackendServices>;

// The answer that a flush gave its caller.
struct FlushAnswer {
  int calls = 0;
  std::optional<std::string> text;
  std::optional<OrvantaError> error;
};

// A platform, and HTTPS backends as a session would make and drive them.
class HTTPSFixture : public ::testing::Test {
 protected:
  static constexpr std::chrono::seconds kHangGuard{30};

  // A section under which everything reports: any client, any country known, no filters that match. With other keys, or
  // without those given as null.
  static Dictionary openSection(const Dictionary& more = {});
  static Dictionary profileOf(Array sections) { return {{"clients", std::move(sections)}}; }

  struct Setup {
    Dictionary profile = profileOf({openSection()});
    BackendIdentity identity = defaultIdentity();
    bool batchEvents = false;
    SharedDictionary userInfo;
    std::string name = "http_post";
    double samplingFactor = 0.0;
    bool evaluate = true;
  };
  // One that batches, under the open section with these changes.
  static Setup batching(const Dictionary& more = {}) {
    Setup setup;
    setup.profile = profileOf({openSection(more)});
    setup.batchEvents = true;
    return setup;
  }
  // One that requires user info and has it, under the open section with these changes.
  static Setup requiring(const Dictionary& more = {}, bool batches = false);
  static BackendIdentity defaultIdentity();
  std::shared_ptr<HTTPSPostBackend> makeBackend(const Setup& setup) { return makeBackend(setup, platform); }
  static std::shared_ptr<HTTPSPostBackend> makeBackend(const Setup& setup, TestBackends& on);

  // One event at the clock's time.
  std::optional<std::string> send(OrvantaBackend& backend, std::uint16_t method, std::int32_t flag = 0,
                                  const SharedDictionary& payload = nullptr, std::uint16_t respCode = 1);
  // Flushes and, once every post has ended, gives what the completion got.
  FlushAnswer flush(HTTPSPostBackend& backend);
  // Occupies every thread that compresses until the promise is kept.
  std::promise<void> holdCompressing();
  // Waits until every post has been handed to the HTTP client (which answers at once unless it holds).
  void settle();
  std::vector<platform::HttpRequest> requests();
  // A field of the events of each post so far, as "1 2 none".
  using Posts = std::vector<std::string>;
  Posts fields(std::string_view key);
  Posts categories() { return fields("_method"); }

  TestBackends platform;
};

}  // namespace orvanta::test
