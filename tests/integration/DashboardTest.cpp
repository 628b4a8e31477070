#include <fmt/core.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <map>
#include <thread>

#include "backends/dashboard/DashboardDatagram.h"
#include "tests/integration/IntegrationFixture.h"
#include "tests/support/UdpServer.h"

namespace orvanta::test {
namespace {

using Clock = std::chrono::steady_clock;
using Seconds = std::chrono::duration<double>;

class DashboardTest : public IntegrationFixture {
 protected:
  static constexpr int kPeriod = 300;  // ms
  // The daemon's own leeway of 0.1 s, and what a busy machine takes to let it run. Less than a period: each tick
  // counts.
  static constexpr double kLeeway = 0.25;
  static constexpr std::size_t kPerSession = 2;  // descriptors: its connection's and its dashboard backend's
  // The last tick before each transmission but the first, counted from the tick before the first.
  static constexpr double kTicksBetween[] = {3, 5, 9};

  Dictionary dashboard(int period, std::uint16_t port) const {
    return {{"dashboard", Dictionary{{"ip", "127.0.0.1"}, {"port", port}, {"reliable", period}}}};
  }
  // The datagrams that the collector has received, by event number.
  std::map<std::uint16_t, std::vector<collector::ReceivedDatagram>> transmissions() {
    std::map<std::uint16_t, std::vector<collector::ReceivedDatagram>> found;
    for (auto& datagram : server->datagrams()) found[datagram.eventNumber].push_back(std::move(datagram));
    return found;
  }
  // The first retransmission follows after the second tick from now, the others a whole number of periods later.
  static void expectSchedule(const std::vector<collector::ReceivedDatagram>& sent, double period) {
    ASSERT_LE(sent.size(), 5U);
    for (std::size_t i = 1; i < sent.size(); ++i) {
      const double waited = sent[i].time - sent[i - 1].time;
      const double least = i == 1 ? period : kTicksBetween[i - 2] * period;
      const double most = i == 1 ? 2 * period : least;
      EXPECT_GT(waited, least - kLeeway) << "event " << sent[i].eventNumber << ", retransmission " << i;
      EXPECT_LT(waited, most + kLeeway) << "event " << sent[i].eventNumber << ", retransmission " << i;
      EXPECT_EQ(sent[i].bytes, sent[0].bytes);
    }
  }
};

TEST_F(DashboardTest, NothingIsLostOrAcknowledgedTwiceWhenAcknowledgementsAreLost) {
  constexpr std::uint16_t kEvents = 40;
  setSection(dashboard(kPeriod, server->dashboardPort()));
  collector::AcknowledgementSettings losing;
  losing.lossPercent = 30;
  server->setAcknowledgements(losing);
  startDaemon();
  auto session = openSession({.sessionID = 7});
  const auto descriptors = daemon->descriptorCount() - kPerSession;
  for (std::uint16_t i = 0; i < kEvents; ++i) send(*session, event(9, i));
  session.reset();  // its backend stays until everything is settled
  const auto settled = [this] {
    const auto all = transmissions();
    return all.size() == kEvents + 2U && std::all_of(all.begin(), all.end(), [](const auto& each) {
             return each.second.back().acknowledgements > 0 || each.second.size() == 5;
           });
  };
  ASSERT_TRUE(server->inbox().waitUntil(settled, kTimeout));
  EXPECT_TRUE(daemon->settles([this] { return daemon->descriptorCount(); }, descriptors));
  EXPECT_TRUE(settled()) << "nothing was sent again after its acknowledgement";

  std::size_t repeated = 0;
  for (const auto& [number, sent] : transmissions()) {
    std::int64_t acknowledged = 0;
    for (const auto& each : sent) acknowledged += each.acknowledgements;
    EXPECT_LE(acknowledged, 1) << "event " << number;
    repeated += sent.size() > 1 ? 1 : 0;
    expectSchedule(sent, kPeriod / 1000.0);
  }
  EXPECT_GT(repeated, 3U);
}

TEST_F(DashboardTest, AThousandSessionsLeaveNothingBehind) {
  setSection(dashboard(20, server->dashboardPort()));
  startQuietDaemon();
  const auto openAndClose = [this](int sessions) {
    constexpr int kAtOnce = 50;
    for (int opened = 0; opened < sessions; opened += kAtOnce) {
      std::vector<std::unique_ptr<OrvantaConnection>> open;
      for (int i = 0; i < kAtOnce; ++i) {
        open.push_back(openSession({.sessionID = 1}));
        send(*open.back(), event(9, 1, {{"key", std::string(100, 'x')}}));
      }
    }
  };
  const auto descriptorCount = [this] { return daemon->descriptorCount(); };
  const auto first = openSession({.sessionID = 1});  // beside it, the connection to the storebag server is kept
  const auto descriptors = daemon->descriptorCount();
  openAndClose(200);  // fills what is kept
  ASSERT_TRUE(daemon->settles(descriptorCount, descriptors));
  const auto threads = daemon->threadCount();
  constexpr std::size_t kLeewayKiB = 512;  // half a KiB a session
  EXPECT_TRUE(daemon->keepsItsMemory(kLeewayKiB, [&] {
    openAndClose(1000);
    EXPECT_TRUE(daemon->settles(descriptorCount, descriptors));
    EXPECT_TRUE(daemon->settles([this] { return daemon->threadCount(); }, threads));
  }));
}

// The dashboard server, and a stranger, flood the daemon with everything but the right acknowledgement.
TEST_F(DashboardTest, AMillionWrongAcknowledgementsRemoveNothingAndDoNoHarm) {
  constexpr unsigned kFlood = 1'000'000;
  UdpServer dashboardServer, stranger;
  const auto numberOf = [](const std::optional<std::vector<std::uint8_t>>& datagram) {
    EXPECT_TRUE(datagram) << "no datagram came";
    return datagram ? decodeDashboardDatagram(*datagram)->header.eventNumber : std::uint16_t{0};
  };
  setSection(dashboard(kPeriod, dashboardServer.port()));
  startQuietDaemon();
  auto bystander = connect();  // without a backend; its calls are carried out by the same threads
  auto session = openSession({.sessionID = 7});
  const auto start = dashboardServer.receive();
  EXPECT_EQ(numberOf(start), 1) << "the session's start";
  dashboardServer.send(*start);  // what comes back acknowledges itself

  send(*session, event(9, 1));
  const auto sentAt = Clock::now();
  const double cpuBefore = daemon->cpuSeconds();
  const auto datagram = dashboardServer.receive();
  const auto awaited = numberOf(datagram);
  ASSERT_EQ(awaited, 2);
  std::atomic<bool> over{false};
  std::thread flooder([&] {
    std::vector<std::uint8_t> wrong(64, 0);
    const std::vector<std::uint8_t> tooShort(datagram->begin(), datagram->begin() + 61), tooLong(2000, 0xff);
    for (unsigned i = 0; i < kFlood; ++i) {
      wrong[60] = static_cast<std::uint8_t>(i >> 8U);
      wrong[61] = static_cast<std::uint8_t>(i);
      if (i % 100 == 0) stranger.sendTo(dashboardServer.sender(), *datagram);
      if (i % 100 == 50) {
        dashboardServer.send(tooShort);
      } else if (i % 100 == 51) {
        dashboardServer.send(tooLong);
      } else if (i % 0x10000 != awaited) {
        dashboardServer.send(wrong);
      }
    }
    over = true;
  });
  std::vector<double> roundTrips;  // of the bystander's calls, in seconds
  while (!over || roundTrips.size() < 100) {
    const auto begun = Clock::now();
    send(*bystander, event(9, 1));
    roundTrips.push_back(Seconds(Clock::now() - begun).count());
  }
  flooder.join();
  const double wall = Seconds(Clock::now() - sentAt).count();
  const double cpu = daemon->cpuSeconds() - cpuBefore;
  std::sort(roundTrips.begin(), roundTrips.end());
  const double median = roundTrips[roundTrips.size() / 2];
  fmt::print("a flood of {:.1f} s: the median of another session's calls was {:.0f} us, the daemon took {:.1f} s\n",
             wall, median * 1e6, cpu);
  // The flooder takes a processor of its own, which on a small machine the calls would otherwise have.
  EXPECT_LT(median, 0.05);
#if !defined(__SANITIZE_THREAD__) && !defined(__SANITIZE_ADDRESS__)
  EXPECT_LT(cpu, 10.0) << "1 us is usual for each acknowledgement, and 10 for each of the calls beside them";
#endif

  // The datagram has kept its schedule, which a removal would have ended.
  const double ticks = std::floor(wall * 1000 / kPeriod) - 1;
  for (const int tick : {2, 5, 10, 19}) {
    if (tick > ticks) break;
    EXPECT_EQ(numberOf(dashboardServer.receive()), awaited);
  }
  // And the right ones still count: they end everything before the last resort or the schedule's end does.
  const auto openBefore = daemon->descriptorCount();
  send(*session, event(9, 2));
  session.reset();
  std::map<int, std::size_t> transmissions;
  while (daemon->descriptorCount() > openBefore - kPerSession) {
    const auto late = dashboardServer.receive(50);
    if (!late) continue;
    ++transmissions[numberOf(late)];
    dashboardServer.send(*late);
  }
  for (const int number : {3, 4}) {
    EXPECT_GE(transmissions[number], 1U);
    EXPECT_LT(transmissions[number], 5U) << "event " << number;
  }
}

}  // namespace
}  // namespace orvanta::test
