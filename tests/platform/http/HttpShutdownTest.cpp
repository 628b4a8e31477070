#include <dlfcn.h>
#include <netdb.h>

#include <atomic>
#include <cstring>

#include "tests/platform/Waiting.h"
#include "tests/platform/http/HttpFixture.h"
#include "tests/support/Threads.h"

// A resolver that hangs on one name until it is let go; libcurl's look-ups come through here.
namespace {
constexpr const char* kHangingName = "hangs.test";
orvanta::test::Counter gHanging, gReleased, gEnded;
std::atomic<int> gRound = 0;  // of the test, so that it may be repeated
}  // namespace

extern "C" int getaddrinfo(const char* node, const char* service, const addrinfo* hints, addrinfo** result) {
  using Function = int (*)(const char*, const char*, const addrinfo*, addrinfo**);
  static const auto real = reinterpret_cast<Function>(::dlsym(RTLD_NEXT, "getaddrinfo"));
  if (node != nullptr && std::strcmp(node, kHangingName) == 0) {
    gHanging.add();
    gReleased.waitFor(gRound);
    gEnded.add();
    return EAI_FAIL;
  }
  return real(node, service, hints, result);
}

namespace orvanta::platform {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

class HttpShutdownTest : public HttpFixture {
 protected:
  std::future<HttpResult> performInThread(const std::shared_ptr<HttpLane>& lane, HttpRequest request) {
    return std::async(std::launch::async, [this, lane, request = std::move(request)]() mutable {
      return client().perform(lane, std::move(request));
    });
  }
};

TEST_F(HttpShutdownTest, TheRestFailsAndCompletes) {
  RawServer server(beSilent);
  const auto lane = client().makeLane();
  auto inFlight = start(lane, post(server.url()));
  auto waiting = start(lane, post(server.url()));
  auto blocked = performInThread(client().makeLane(), get(server.url()));
  ASSERT_TRUE(server.waitForRequests(2));
  client().shutdown(milliseconds(1));
  for (auto* result : {&inFlight, &waiting, &blocked}) expectError(await(*result), "shutting down");
  EXPECT_EQ(server.requests().size(), 2U);
  auto late = start(lane, post(server.url()));
  EXPECT_EQ(await(late).error, "The HTTP client has been shut down");
  EXPECT_EQ(perform(get(server.url())).error, "The HTTP client has been shut down");
}

TEST_F(HttpShutdownTest, AHangingResolverHoldsUpNoCaller) {
  const std::string url = std::string("http://") + kHangingName + "/";
  const int before = gEnded.value();
  ++gRound;
  auto result = start(client().makeLane(), post(url));
  auto blocked = performInThread(client().makeLane(), get(url));
  ASSERT_TRUE(gHanging.waitFor(before + 1));
  expectError(perform(within(milliseconds(100), get(url))), "Timed out after 100 ms, not connected");
  client().abortBlockingRequests();
  expectError(await(blocked), "Aborted");
  _client.reset();
  expectError(await(result), "shutting down");
  EXPECT_EQ(gEnded.value(), before);
  gReleased.add();
  EXPECT_TRUE(gEnded.waitFor(gHanging.value()));
}

TEST_F(HttpShutdownTest, AbortingEndsBlockedCallersOnly) {
  RawServer silent(beSilent);
  orvanta::test::Counter gate;
  RawServer slow([&](RawConnection& connection) {
    if (!connection.readRequest()) return;
    gate.waitFor(1);
    connection.write(RawServer::response("200 OK"));
    connection.waitForClose();
  });
  const auto lane = client().makeLane();
  auto other = start(client().makeLane(), post(slow.url()));
  auto inFlight = performInThread(lane, get(silent.url()));
  ASSERT_TRUE(silent.waitForRequests(1) && slow.waitForRequests(1));
  auto waiting = performInThread(lane, get(silent.url()));
  client().abortBlockingRequests();
  expectError(await(inFlight), "Aborted");
  expectError(await(waiting), "Aborted");
  expectError(perform(get(slow.url())), "Aborted");
  EXPECT_EQ(silent.requests().size(), 1U);
  gate.add();
  EXPECT_EQ(statusOf(await(other)), 200) << "no thread waits for this one";
}

// Every request ends once, though others are submitted, aborted and shut down at the same time.
TEST_F(HttpShutdownTest, EveryRequestEndsExactlyOnce) {
  RawServer server(answering("200 OK"));
  for (int round = 0; round < 10; ++round) {
    makeClient();
    std::atomic<int> started{0}, observed{0}, completed{0};
    orvanta::test::inThreads(7, [&](int thread) {
      if (thread == 4) return client().abortBlockingRequests();
      if (thread > 4) return client().shutdown(milliseconds(round * (thread - 4)));
      const auto lane = client().makeLane();
      for (int n = 0; n < 20; ++n) {
        if (thread == 0) {
          client().perform(lane, get(server.url()));
          continue;
        }
        ++started;
        client().start(
            lane, post(server.url()), [&](const HttpResult&) { return ++observed > 0; },
            [&](HttpResult) { ++completed; });
      }
    });
    EXPECT_EQ(observed, started);
    ASSERT_TRUE(_pool.drain(seconds(30)));
    EXPECT_EQ(completed, started);
  }
}

}  // namespace
}  // namespace orvanta::platform
