#include "tests/support/RandomGroups.h"

#include <gtest/gtest.h>
#include <malloc.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <functional>
#include <thread>

#include "daemon/OrvantadAgent.h"
#include "interface/OrvantaConstants.h"
#include "interface/RemoteCalls.h"
#include "platform/codec/PropertyList.h"
#include "platform/core/Log.h"
#include "tests/support/TestPlatform.h"

namespace orvanta::test {
namespace {

// Formats every line, as a daemon at its most talkative does, and keeps what must never be said.
struct Talkative final : platform::LogSink {
  Talkative() {
    platform::installLogSink(this);
    platform::setLogLevel(platform::LogLevel::debug);
  }
  ~Talkative() override { platform::installLogSink(nullptr); }
  void write(platform::LogLevel, std::string_view line) override {
    if (line.find("was dropped") != std::string_view::npos) ++dropped;
  }
  std::atomic<int> dropped{0};  // sessions before their end, replies without being given
};

// The whole daemon but its main and its network: listener, agent, sessions and backends, on a pool of threads.
class WholeDaemon {
 public:
  WholeDaemon() {
    const auto& files = device.get().files();
    device.directory.write("etc/entitlements.d/test.plist",
                           *platform::writeXmlPropertyList(
                               Dictionary{{"user", std::to_string(::getuid())},
                                          {"entitlements", Dictionary{{"com.kovalt.private.orvantad", true}}}}));
    device.http.answer = [this](const platform::HttpRequest&) {
      const auto number = ++_posts;
      if (number % 64 == 0) forgetRecords();
      return ScriptedHttpClient::status(number % 50 == 0 ? 503 : 200);
    };
    for (std::size_t i = 0; i < _storebags.size(); ++i) _storebags[i] = storebag(i);
    auto made = platform::Listener::create(
        device.get().pool(), files.runtimeDirectory, std::string(kOrvantaServiceName),
        {kDaemonConnectionLimits, kMaximumConnectionsPerUser}, [this](platform::OfferedConnection&& offered) {
          return agent.listenerShouldAcceptNewConnection(std::move(offered));
        });
    if (!made) throw std::runtime_error(made.error());
    _listener = std::move(*made);
    _listener->resume();
  }
  ~WholeDaemon() {
    _listener->stop();
    agent.sessions().endAll();
    device.get().pool().drain(std::chrono::seconds(30));
  }
  std::string socketDirectory() { return device.get().files().runtimeDirectory; }
  void changeStorebag(std::uint32_t variant) { _current = variant; }
  // The scripted servers' records are not the daemon's memory.
  void forgetRecords() {
    device.http.clear();
    const std::lock_guard lock(device.powerLog.mutex);
    device.powerLog.records.clear();
  }
  // Returns whether all sessions have ended, and the threads that stood in for blocked ones, each with a compressor of
  // its own, have gone.
  bool isIdle() {
    auto& platform = device.get();
    return agent.sessions().openCount() == 0 && platform.keepAlive().begun() == platform.keepAlive().ended() &&
           platform.pool().threadCount() <= kThreads;
  }

  static constexpr std::size_t kThreads = 4;
  TestServices<DaemonServices> device{kThreads};
  OrvantadAgent agent{device, [this](std::int32_t, StorebagFetch& fetch) {
                        fetch.maxAge = 0;
                        fetch.version = "1.0";
                        // A server that is slow now and then keeps the agent's lock meanwhile.
                        if (++_fetches % 32 == 0) std::this_thread::sleep_for(std::chrono::milliseconds(2));
                        return _storebags[_current];
                      }};

 private:
  // Other thresholds, and backends that a parent may lack.
  static SharedDictionary storebag(std::size_t variant) {
    const double thresholds[] = {1.0, 0.75, 0.5, 0.25};
    const Dictionary client{{"post_url", "http://127.0.0.1/post"},
                            {"realtime_post_url", "http://127.0.0.1/realtime"},
                            {"sampling_threshold", thresholds[variant]},
                            {"event_threshold", 20}};
    Dictionary section{{"http_post", Dictionary{{"clients", Array{client}}}}, {"voltmark", Dictionary{}}};
    if (variant % 2 == 1) section.set("http_post2", Dictionary{{"clients", Array{client}}});
    return std::make_shared<const Dictionary>(std::move(section));
  }

  std::array<SharedDictionary, GroupOperations::kVariants> _storebags;
  std::atomic<std::uint32_t> _current{0};
  std::atomic<std::uint64_t> _fetches{0}, _posts{0};
  std::unique_ptr<platform::Listener> _listener;
};

bool comesTrue(const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(60);
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  return true;
}

// What the allocator keeps aside for its threads counts as allocated, so that it is never quite the same.
constexpr std::size_t kMemoryNoise = 2U << 20U;
// Of this process. Sanitizers have allocators, and leak checks, of their own, which this does not see.
std::size_t allocatedBytes() {
  return ::mallinfo2().uordblks;
}

std::size_t openDescriptors() {
  const auto entries = std::filesystem::directory_iterator("/proc/self/fd");
  return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
}

TEST(RandomGroupsTest, TwoHundredSessionsInTwentyGroupsAnswerEverythingAndLeaveNothing) {
  const Talkative log;
  WholeDaemon daemon;
  std::size_t descriptors = 0, bytes = 0;
  const auto compare = [&](bool first) {
    ASSERT_TRUE(comesTrue([&] { return daemon.isIdle(); }));
    daemon.forgetRecords();
    if (first) {
      descriptors = openDescriptors();
      bytes = allocatedBytes();
      return;
    }
    // A connection that its client gave up before it was accepted may still be on its way.
    EXPECT_TRUE(comesTrue([&] { return openDescriptors() <= descriptors; })) << openDescriptors() << " are open";
    EXPECT_TRUE(comesTrue([&] { return allocatedBytes() <= bytes + kMemoryNoise; }))
        << allocatedBytes() << " bytes are in use, after the first round " << bytes;
  };
  {
    RandomGroups groups(
        {daemon.socketDirectory(), [&daemon](std::uint32_t variant) { daemon.changeStorebag(variant); }, compare},
        std::chrono::seconds(3));
    groups.run();
    EXPECT_GT(groups.eventsAggregated(), groups.eventsSent() / 10);
  }
  std::printf("%zu bytes in use after the first round, %zu at the end\n", bytes, allocatedBytes());
  EXPECT_EQ(log.dropped.load(), 0);
}

}  // namespace
}  // namespace orvanta::test
