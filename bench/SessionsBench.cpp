#include <fmt/core.h>
#include <sched.h>

#include <chrono>
#include <filesystem>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "bench/BenchDaemon.h"
#include "bench/CallDriver.h"
#include "bench/RawPeers.h"
#include "bench/Stages.h"
#include "daemon/OrvantadAgent.h"
#include "platform/core/Log.h"
#include "tests/support/TestPlatform.h"

namespace orvanta::bench {

namespace {

constexpr std::uint64_t kWindow = 64;

// Confines the threads of the process, and with them those that they will start, to its first `cores` processors.
void confine(pid_t pid, unsigned cores) {
  cpu_set_t allowed, set;
  CPU_ZERO(&allowed);
  CPU_ZERO(&set);
  if (::sched_getaffinity(0, sizeof allowed, &allowed) != 0) throw std::runtime_error("cannot ask for the processors");
  unsigned taken = 0;
  for (int cpu = 0; cpu < CPU_SETSIZE && taken < cores; ++cpu) {
    if (!CPU_ISSET(cpu, &allowed)) continue;
    CPU_SET(cpu, &set);
    ++taken;
  }
  if (taken < cores) throw std::runtime_error(fmt::format("this needs {} processors", cores));
  for (const auto& thread : std::filesystem::directory_iterator("/proc/" + std::to_string(pid) + "/task")) {
    const auto id = static_cast<pid_t>(std::stol(thread.path().filename().string()));
    if (::sched_setaffinity(id, sizeof set, &set) != 0) throw std::runtime_error("cannot confine the daemon");
  }
}

// All sessions send at once, each with one burst under way and one behind it, until the last post has been made.
Figure sendAtOnce(const BenchDaemon& daemon, const PostSink& sink, std::size_t sessions, std::uint64_t eventsEach) {
  std::vector<std::unique_ptr<CallDriver>> drivers;
  for (std::size_t i = 0; i < sessions; ++i) {
    drivers.push_back(std::make_unique<CallDriver>(daemon.process().socketPath()));
    drivers.back()->configure(true);
  }
  const auto burst = repeated(sampleCall(), kWindow);
  const std::uint64_t events = eventsEach * sessions;
  const std::uint64_t posts = sink.posts() + events / 50;
  const Stretch time(daemon.process().process().pid());
  for (const auto& driver : drivers) driver->send(burst);
  for (std::uint64_t sent = kWindow; sent < eventsEach; sent += kWindow) {
    for (const auto& driver : drivers) {
      driver->send(burst);
      driver->receive(kNilAnswer * kWindow);
    }
  }
  for (const auto& driver : drivers) driver->receive(kNilAnswer * kWindow);
  for (const auto& driver : drivers) driver->call(encodeCall("flushMessagesWithCompletion", {}));
  // Sleeps in between, to leave the processors to the daemon.
  const auto waitFor = [&sink](std::uint64_t expected) {
    while (sink.posts() < expected) std::this_thread::sleep_for(std::chrono::microseconds(200));
  };
  waitFor(posts);
  const Figure figure = figureOf(time, events);
  drivers.clear();
  waitFor(posts + sessions);  // each session's last record must not count in the next measurement
  return figure;
}

void benchScaling() {
  printHeading("Many sessions: events batched 50 a post, daemon on 1 and on 2 processors");
  if (std::thread::hardware_concurrency() < 2) {
    fmt::print("  this machine has one processor\n");
    return;
  }
  // Whole windows and whole posts: the same number for each count of sessions.
  constexpr std::uint64_t kEvents = 64 * 1'600 * 4;
  for (const std::size_t sessions : {1, 8, 64}) {
    Figure figures[2];
    for (const unsigned cores : {1U, 2U}) {
      const PostSink sink;
      const BenchDaemon daemon(batchingSection(sink), false);
      confine(daemon.process().process().pid(), cores);
      sendAtOnce(daemon, sink, sessions, 1'600);  // warms up
      figures[cores - 1] = sendAtOnce(daemon, sink, sessions, kEvents / sessions);
      printFigure(
          fmt::format("{} session{}, {} processor{}", sessions, sessions > 1 ? "s" : "", cores, cores > 1 ? "s" : ""),
          figures[cores - 1]);
    }
    fmt::print("  {:<58} {:>12.2f} x\n", "  2 processors against 1", figures[1].perSecond / figures[0].perSecond);
  }
  fmt::print("  (the machine has {}; clients and the sink of the posts take theirs from the same)\n",
             std::thread::hardware_concurrency());
}

// The cost of joining, querying and leaving a group of that size, in microseconds.
struct GroupCost {
  double join = 0;
  double ask = 0;
  double leave = 0;
};

GroupCost costInGroupOf(std::size_t size) {
  platform::setLogLevel(platform::LogLevel::error);
  test::TestServices<DaemonServices> device;
  OrvantadAgent agent(device, [](std::int32_t, StorebagFetch&) { return nullptr; });
  std::vector<std::shared_ptr<OrvantadSession>> sessions;
  const auto configure = [](OrvantadSession& session, std::size_t number) {
    session.setSessionInfo(
        std::make_shared<const Dictionary>(Dictionary{
            {"sessionID", static_cast<std::int64_t>(number)},
            {"clientType", 5},
            {"hierarchyToken", Dictionary{{"tokenID", "group"}, {"level", static_cast<std::int64_t>(number % 4)}}}}),
        std::make_shared<const Dictionary>(Dictionary{{"clientName", "c"}, {"serviceName", "s"}}), nullptr, false, {});
  };
  for (std::size_t i = 0; i < size; ++i) {
    sessions.push_back(OrvantadSession::create(device, agent, nullptr));
    configure(*sessions.back(), i);
  }
  // A session that is configured again leaves its place and takes the last one.
  GroupCost cost;
  std::size_t next = 0;
  cost.join = measure(0.5, [&] {
                configure(*sessions[next], next);
                next = (next + 1) % size;
                return 1;
              }).cpuPerEvent;
  cost.ask = measure(0.5, [&] {
               auto& session = *sessions[next];
               next = (next + 1) % size;
               const AgentLock::Held lock(agent.lock());
               agent.parentSessionForChild(session);
               agent.getAncestorWithAggregatorForSession(session);
               agent.parentSessionIDStringForSession(session);
               return 1;
             }).cpuPerEvent;
  const Stretch leaving;
  for (const auto& session : sessions) {
    agent.invalidated(session);
    session->end();
  }
  cost.leave = figureOf(leaving, size).cpuPerEvent;
  return cost;
}

void benchGroups() {
  printHeading("A session in a group of 1,000 against one of 10");
  const GroupCost small = costInGroupOf(10), large = costInGroupOf(1'000);
  printRatio("configured again, and so registered again", large.join, small.join, 1.5);
  printRatio("parent, aggregator above and ancestry asked for", large.ask, small.ask, 1.5);
  printRatio("leaves and ends", large.leave, small.leave, 2.0);
}

}  // namespace

void benchSessions() {
  benchGroups();
  benchScaling();
}

}  // namespace orvanta::bench
