#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <mutex>
#include <thread>

#include "tests/platform/Waiting.h"
#include "tests/platform/http/HttpFixture.h"

namespace orvanta::platform {
namespace {

using orvanta::test::Counter;

std::string pathOf(const std::string& request) {
  const std::size_t begin = request.find(' ') + 1;
  return request.substr(begin, request.find(' ', begin) - begin);
}

class HttpLaneTest : public HttpFixture {
 protected:
  // Answers everything, what begins with /held only once the gate is open.
  RawServer::Script holding(Counter& gate) {
    return [&gate](RawConnection& connection) {
      while (const auto request = connection.readRequest()) {
        if (pathOf(*request).rfind("/held", 0) == 0) gate.waitFor(1);
        connection.write(RawServer::response("200 OK"));
      }
    };
  }
  static std::vector<std::string> paths(const RawServer& server) {
    std::vector<std::string> all;
    for (const std::string& request : server.requests()) all.push_back(pathOf(request));
    return all;
  }
};

TEST_F(HttpLaneTest, ALaneKeepsItsOrderToTheLastCompletion) {
  constexpr int kLanes = 4;
  constexpr int kRequests = 100;
  RawServer server(answering("200 OK"));
  using Order = std::map<char, std::vector<std::string>>;  // by lane
  std::mutex mutex;
  Order completed, arrived, expected;
  Counter ended;
  std::map<char, std::shared_ptr<HttpLane>> lanes;
  for (int i = 0; i < kLanes * kRequests; ++i) {
    const std::string path = "/" + std::to_string(i % kLanes) + "/" + std::to_string(i);
    expected[path[1]].push_back(path);
    auto& lane = lanes[path[1]];
    if (!lane) lane = client().makeLane();
    client().start(lane, post(server.url(path)), {}, [&, path](HttpResult) {
      if (path == "/0/0") server.waitForRequests(kLanes * kRequests);  // none of its lane overtakes it meanwhile
      {
        const std::lock_guard lock(mutex);
        completed[path[1]].push_back(path);
      }
      ended.add();
    });
  }
  lanes.clear();  // the client alone holds them now
  ended.waitFor(kLanes * kRequests);
  for (const std::string& path : paths(server)) arrived[path[1]].push_back(path);
  EXPECT_EQ(arrived, expected);
  EXPECT_EQ(completed, expected);
  EXPECT_LE(server.connectionCount(), std::size_t{kLanes});
}

TEST_F(HttpLaneTest, TheNextWaitsForTheOneBeforeOtherLanesDoNot) {
  Counter gate;
  RawServer server(holding(gate));
  const auto lane = client().makeLane();
  auto first = start(lane, post(server.url("/held")));
  auto second = start(lane, post(server.url("/second")));
  ASSERT_TRUE(server.waitForRequests(1));
  for (int i = 0; i < 5; ++i) EXPECT_EQ(statusOf(perform(get(server.url("/other")))), 200);
  EXPECT_EQ(paths(server).size(), 6U) << "the second of the lane was not sent";
  gate.add();
  EXPECT_EQ(statusOf(await(first)), 200);
  EXPECT_EQ(statusOf(await(second)), 200);
  EXPECT_EQ(paths(server).back(), "/second");
  client().start(lane, post(server.url("/unheard")), {}, {});  // neither observer nor completion is needed
  ASSERT_TRUE(server.waitForRequests(8));
}

TEST_F(HttpLaneTest, AFailureLetsTheNextGo) {
  RawServer server([](RawConnection& connection) {
    while (const auto request = connection.readRequest()) {
      if (pathOf(*request) == "/broken") return connection.reset();
      connection.write(RawServer::response("500 No"));
    }
  });
  const auto lane = client().makeLane();
  auto broken = start(lane, post(server.url("/broken")));
  auto unsendable = start(lane, post("http://127.0.0.1:1/"));
  auto good = start(lane, post(server.url("/good")));
  expectError(await(broken));
  expectError(await(unsendable));
  EXPECT_EQ(statusOf(await(good)), 500);
}

// Of what is refused at once the caller's thread tells the observer.
TEST_F(HttpLaneTest, TheObserverComesFirstAndTheCompletionOnThePool) {
  RawServer server(answering("503 Off"));
  for (const std::string& url : {server.url(), std::string("http://127.0.0.1:1/"), std::string("ftp://127.0.0.1/")}) {
    const bool refused = url.starts_with("ftp");
    std::thread::id observer;
    std::promise<std::thread::id> completer;
    client().start(
        client().makeLane(), post(url),
        [&](const HttpResult& result) {
          EXPECT_EQ(result.response.has_value(), result.error.empty());
          observer = std::this_thread::get_id();
          return true;
        },
        [&](HttpResult result) {
          EXPECT_NE(observer, std::thread::id());
          EXPECT_EQ(has(result.error, "neither http nor https"), refused);
          completer.set_value(std::this_thread::get_id());
        });
    auto future = completer.get_future();
    ASSERT_EQ(future.wait_for(std::chrono::seconds(30)), std::future_status::ready);
    EXPECT_NE(future.get(), observer);
    EXPECT_EQ(observer == std::this_thread::get_id(), refused);
  }
}

TEST_F(HttpLaneTest, LimitsOnWaitingBytes) {
  HttpLimits limits;
  limits.laneBytes = 10'000;
  limits.totalBytes = 15'000;
  makeClient(limits);
  Counter gate;
  RawServer server(holding(gate));
  const std::string body(5'000 - 1024, 'b');  // each request is charged 5000
  const auto lane = client().makeLane();
  const auto other = client().makeLane();
  const auto free = client().makeLane(HttpClient::LaneKind::unrefused);
  std::vector<std::future<HttpResult>> accepted;
  for (int i = 0; i < 5; ++i) accepted.push_back(start(free, post(server.url("/held/free"), body + body)));
  accepted.push_back(start(lane, post(server.url("/held"), body)));
  accepted.push_back(start(lane, post(server.url("/held"), body)));
  auto laneFull = start(lane, post(server.url("/refused"), ""));
  accepted.push_back(start(other, post(server.url("/held"), body)));
  auto allFull = start(other, post(server.url("/refused"), ""));
  EXPECT_EQ(await(laneFull).error, "Refused: 10000 bytes wait in this lane, 1024 more would exceed its limit of 10000");
  EXPECT_EQ(await(allFull).error, "Refused: 15000 bytes wait in all lanes, 1024 more would exceed the limit of 15000");
  gate.add();
  for (auto& result : accepted) EXPECT_EQ(statusOf(await(result)), 200);
  auto again = start(lane, post(server.url("/fits"), std::string(10'000 - 1024, 'b')));
  EXPECT_EQ(statusOf(await(again)), 200) << "what has ended waits no more";
  auto tooLarge = start(lane, post(server.url("/refused"), std::string(10'000 - 1023, 'b')));
  EXPECT_TRUE(has(await(tooLarge).error, "Refused: 0 bytes wait"));
  for (const std::string& path : paths(server)) EXPECT_NE(path, "/refused");
}

// Servers that never answer hold as many requests as may be in flight; those of unrefused lanes must get past them.
TEST_F(HttpLaneTest, SilentServersDoNotHoldUpUnrefusedLanes) {
  constexpr std::size_t kMaximumInFlight = 64;
  Counter gate;
  RawServer server(holding(gate));
  RawServer storebags(answering("200 OK"));
  std::vector<std::future<HttpResult>> results;
  for (std::size_t i = 0; i < kMaximumInFlight + 10; ++i) {
    results.push_back(start(client().makeLane(), post(server.url("/held"))));
  }
  ASSERT_TRUE(server.waitForRequests(kMaximumInFlight));
  const auto lane = client().makeLane(HttpClient::LaneKind::unrefused);
  EXPECT_EQ(statusOf(client().perform(lane, get(storebags.url()))), 200);
  EXPECT_EQ(server.requests().size(), kMaximumInFlight);
  gate.add();
  for (auto& result : results) EXPECT_EQ(statusOf(await(result)), 200);
}

TEST_F(HttpLaneTest, TimeSpentWaitingInTheLaneCounts) {
  Counter gate;
  RawServer server(holding(gate));
  const auto lane = client().makeLane();
  auto first = start(lane, post(server.url("/held")));
  auto late = start(lane, within(std::chrono::milliseconds(50), get(server.url("/late"))));
  auto patient = start(lane, within(std::chrono::seconds(60), get(server.url("/patient"))));
  EXPECT_EQ(await(late).error, "Timed out after 50 ms, waiting for its turn");
  gate.add();
  EXPECT_EQ(statusOf(await(first)), 200);
  EXPECT_EQ(statusOf(await(patient)), 200);
  EXPECT_EQ(paths(server), (std::vector<std::string>{"/held", "/patient"}));
}

// Both threads of the pool wait for a request whose completion chain needs the pool.
TEST_F(HttpLaneTest, BlockedCallersLeaveThePoolAlive) {
  Counter gate;
  RawServer server(holding(gate));
  Counter answered;
  for (int i = 0; i < 4; ++i) {
    _pool.post([&] {
      EXPECT_EQ(statusOf(perform(get(server.url("/held")))), 200);
      answered.add();
    });
  }
  ASSERT_TRUE(server.waitForRequests(4));
  auto opener = start(client().makeLane(), post(server.url("/free")));
  EXPECT_EQ(statusOf(await(opener)), 200);
  gate.add();
  answered.waitFor(4);
}

// How often each thread called "http" has been given up or taken off a processor.
std::map<std::string, std::string> httpThreadSwitches() {
  std::map<std::string, std::string> switches;
  for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
    std::ifstream status(task.path() / "status");
    std::string line;
    std::getline(status, line);
    if (line != "Name:\thttp") continue;
    std::string& counts = switches[task.path().filename()];
    while (std::getline(status, line)) {
      if (line.find("ctxt_switches") != std::string::npos) counts += line;
    }
  }
  return switches;
}

// Another client's time-out measures a while, in which the thread of an idle one must not run at all. It may still be
// on its way to sleep in the first of them.
TEST_F(HttpLaneTest, AnIdleClientHasNoWakeUps) {
  RawServer server(answering("200 OK"));
  RawServer silent(beSilent);
  ASSERT_EQ(statusOf(perform(get(server.url()))), 200);
  ASSERT_EQ(httpThreadSwitches().size(), 1U);
  const std::string idle = httpThreadSwitches().begin()->first;
  const auto other = makeCurlHttpClient(_pool, {});
  bool slept = false;
  for (int i = 0; i < 5 && !slept; ++i) {
    const std::string before = httpThreadSwitches()[idle];
    EXPECT_FALSE(
        other->perform(other->makeLane(), within(std::chrono::milliseconds(1500), get(silent.url()))).response);
    slept = httpThreadSwitches()[idle] == before;
  }
  EXPECT_TRUE(slept);
}

TEST_F(HttpLaneTest, CompletionsMayHandInTheNext) {
  HttpLimits limits;
  limits.laneBytes = 1024;  // one at a time
  makeClient(limits);
  RawServer server(answering("200 OK"));
  const auto lane = client().makeLane();
  std::promise<int> done;
  std::function<void(int)> next = [&](int left) {
    client().start(lane, post(server.url(), ""), {}, [&, left](HttpResult result) {
      if (left == 0 || statusOf(result) != 200) return done.set_value(left);
      next(left - 1);
    });
  };
  next(20);
  EXPECT_EQ(done.get_future().get(), 0);
}

}  // namespace
}  // namespace orvanta::platform
