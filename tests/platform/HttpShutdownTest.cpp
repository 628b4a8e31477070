#include <dlfcn.h>
#include <netdb.h>

#include <atomic>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <thread>

#include "tests/platform/HttpFixture.h"

namespace {

// A resolver that hangs on one name until it is let go; libcurl's look-ups come through here.
class HangingResolver {
 public:
  static constexpr const char* kName = "hangs.test";

  void hang() {
    std::unique_lock lock(_mutex);
    ++_hanging;
    _changed.notify_all();
    _changed.wait(lock, [&] { return _released; });
    --_hanging;
    _changed.notify_all();
  }
  bool waitUntilHanging() {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, std::chrono::seconds(30), [&] { return _hanging > 0; });
  }
  bool hanging() {
    const std::lock_guard lock(_mutex);
    return _hanging > 0;
  }
  void release() {
    std::unique_lock lock(_mutex);
    _released = true;
    _changed.notify_all();
    _changed.wait(lock, [&] { return _hanging == 0; });
    _released = false;
  }

 private:
  std::mutex _mutex;
  std::condition_variable _changed;
  int _hanging = 0;        // guarded by _mutex
  bool _released = false;  // guarded by _mutex
};
HangingResolver gResolver;

}  // namespace

extern "C" int getaddrinfo(const char* node, const char* service, const addrinfo* hints, addrinfo** result) {
  using Function = int (*)(const char*, const char*, const addrinfo*, addrinfo**);
  static const auto real = reinterpret_cast<Function>(::dlsym(RTLD_NEXT, "getaddrinfo"));
  if (node != nullptr && std::strcmp(node, HangingResolver::kName) == 0) {
    gResolver.hang();
    return EAI_FAIL;
  }
  return real(node, service, hints, result);
}

namespace platform {
namespace {

using orvanta::test::RawConnection;
using orvanta::test::RawServer;
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

TEST_F(HttpShutdownTest, RequestsThatEndInTimeGetTheirAnswers) {
  RawServer server(answering("200 OK"));
  const auto lane = client().makeLane();
  std::vector<std::future<HttpResult>> results;
  for (int i = 0; i < 30; ++i) results.push_back(start(lane, post(server.url())));
  client().shutdown(seconds(30));
  for (auto& result : results) EXPECT_EQ(statusOf(await(result)), 200);
}

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

TEST_F(HttpShutdownTest, DestructionEndsWhatIsInFlight) {
  RawServer server(beSilent);
  auto result = start(client().makeLane(), post(server.url()));
  ASSERT_TRUE(server.waitForRequests(1));
  _client.reset();
  expectError(await(result));
}

TEST_F(HttpShutdownTest, AHangingResolverHoldsNobody) {
  const std::string url = std::string("http://") + HangingResolver::kName + "/";
  auto result = start(client().makeLane(), post(url));
  auto blocked = performInThread(client().makeLane(), get(url));
  ASSERT_TRUE(gResolver.waitUntilHanging());
  expectError(perform(within(milliseconds(100), get(url))), "Timed out after 100 ms, not connected");
  client().abortBlockingRequests();
  expectError(await(blocked), "Aborted");
  _client.reset();
  expectError(await(result), "shutting down");
  EXPECT_TRUE(gResolver.hanging());
  gResolver.release();
}

TEST_F(HttpShutdownTest, AbortingEndsBlockedCallersOnly) {
  RawServer silent(beSilent);
  std::promise<void> gate;
  RawServer slow([opened = gate.get_future().share()](RawConnection& connection) {
    if (!connection.readRequest()) return;
    opened.wait_for(seconds(30));
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
  gate.set_value();
  EXPECT_EQ(statusOf(await(other)), 200) << "nobody waits for this one";
}

// Every request ends once, whoever hands in, aborts and shuts down at the same time.
TEST_F(HttpShutdownTest, EveryRequestEndsExactlyOnce) {
  RawServer server(answering("200 OK"));
  for (int round = 0; round < 10; ++round) {
    makeClient();
    std::atomic<int> started{0};
    std::atomic<int> observed{0};
    std::atomic<int> completed{0};
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
      threads.emplace_back([&, i] {
        const auto lane = client().makeLane();
        for (int n = 0; n < 20; ++n) {
          if (i == 0) {
            client().perform(lane, get(server.url()));
            continue;
          }
          ++started;
          client().start(
              lane, post(server.url()), [&](const HttpResult&) { return ++observed > 0; },
              [&](HttpResult) { ++completed; });
        }
      });
    }
    threads.emplace_back([&] { client().abortBlockingRequests(); });
    threads.emplace_back([&] { client().shutdown(milliseconds(round)); });
    client().shutdown(milliseconds(round * 2));
    for (auto& thread : threads) thread.join();
    EXPECT_EQ(observed, started);
    ASSERT_TRUE(_pool.drain(seconds(30)));
    EXPECT_EQ(completed, started);
  }
}

}  // namespace
}  // namespace platform
