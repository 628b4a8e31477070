#include "backends/dashboard/DashboardBackend.h"

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <sys/epoll.h>
#include <sys/resource.h>

#include <atomic>
#include <filesystem>
#include <map>

#include "backends/dashboard/DashboardDatagram.h"
#include "tests/platform/Waiting.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"
#include "tests/support/UdpServer.h"

// Counts the watches that are cancelled when their descriptor has been closed, and may be another's by now.
namespace {
std::atomic<int> gCancelledTooLate;
}

extern "C" int epoll_ctl(int epoll, int operation, int fd, epoll_event* event) {
  static const auto real = reinterpret_cast<decltype(&epoll_ctl)>(::dlsym(RTLD_NEXT, "epoll_ctl"));
  const int result = real(epoll, operation, fd, event);
  if (result != 0 && operation == EPOLL_CTL_DEL) ++gCancelledTooLate;
  return result;
}

namespace orvanta {
namespace {
using test::eventually;

class DashboardBackendTest : public ::testing::Test {
 protected:
  using Backend = std::shared_ptr<DashboardBackend>;

  Dictionary profile(const Dictionary& more = {}) const {
    Dictionary all{{"ip", "127.0.0.1"}, {"port", static_cast<int>(server.port())}};
    all.merge(more);
    return all;
  }
  Backend make(const std::optional<Dictionary>& content) {
    const auto shared = content ? std::make_shared<const Dictionary>(*content) : nullptr;
    BackendSetup setup;
    setup.identity.sessionID = 1;
    setup.identity.clientType = 7;
    setup.identity.deviceID = "D";
    setup.identity.selfVersion = {8, 0, 0};
    return DashboardBackend::create(platform, "dashboard", shared, setup);
  }
  static std::optional<std::string> send(DashboardBackend& backend, const SharedDictionary& payload = nullptr) {
    Event event{payload, {123, 0}, 5, 6};
    return backend.sendMessage(event);
  }
  // The next datagram taken apart.
  DashboardPacket received() {
    const auto datagram = server.receive();
    EXPECT_TRUE(datagram) << "no datagram came";
    const auto packet = decodeDashboardDatagram(datagram.value_or(std::vector<std::uint8_t>()));
    return packet ? *packet : DashboardPacket{};
  }
  static std::size_t openSockets() {
    std::size_t count = 0;
    for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
      std::error_code gone;
      if (std::filesystem::read_symlink(entry, gone).string().starts_with("socket:")) ++count;
    }
    return count;
  }
  // Cleans up and waits until the backend has gone and its descriptor with it.
  static bool goes(Backend& backend) {
    const std::weak_ptr<DashboardBackend> weak = backend;
    backend->cleanup();
    backend.reset();
    return eventually([&] { return weak.expired(); });
  }

  test::LogCapture log;  // outlives the platform's threads
  test::TestServices<BackendServices> platform;
  test::UdpServer server;
};

TEST_F(DashboardBackendTest, SetUpFailuresLeaveOneLineAndNoSocket) {
  const std::size_t before = openSockets();
  const auto refuses = [&](const std::optional<Dictionary>& content, const std::string& line) {
    log.clear();
    EXPECT_EQ(make(content), nullptr) << line;
    EXPECT_EQ(log.lines(), std::vector<std::string>{"<3>DashboardBackend(initWithName): " + line});
  };
  refuses(std::nullopt, "initWitName with all null params.");
  refuses(Dictionary{}, "can't resolve server IP");
  refuses(Dictionary{{"ip", "127.0.0.1"}}, "can't resolve server port");
  refuses(Dictionary{{"ip", "localhost"}, {"port", 1}}, "socket connect() failed.");
  refuses(Dictionary{{"ip", "127.0.0.1 and more"}, {"port", 1}, {"reliable", 5}}, "socket connect() failed.");
  EXPECT_EQ(DashboardBackend::create(platform, "dashboard", std::nullopt, 1, {}), nullptr);
  EXPECT_EQ(openSockets(), before);

  rlimit limit{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &limit), 0);
  const rlimit none{0, limit.rlim_max};
  ::setrlimit(RLIMIT_NOFILE, &none);
  refuses(profile(), "socket() failed (24)");
  ::setrlimit(RLIMIT_NOFILE, &limit);
}

TEST_F(DashboardBackendTest, SettingsFromTheProfile) {
  // The setting, the period in milliseconds, warnings.
  const std::tuple<Value, int, std::size_t> rows[] = {
      {250, 250, 0}, {"20", 20, 0}, {-3, 500, 1}, {true, 500, 1}, {1e300, 86'400'000, 1}};
  for (const auto& [reliable, period, warnings] : rows) {
    log.clear();
    auto backend = make(profile({{"reliable", reliable}}));
    EXPECT_EQ(backend->period().count(), period) << reliable.description();
    EXPECT_TRUE(backend->reliableUDP());
    EXPECT_EQ(log.count("<4>"), warnings);
    EXPECT_TRUE(goes(backend));
  }
  const auto plain = make(profile({{"display_url", "http://show"}}));
  EXPECT_EQ(plain->period().count(), 500);
  EXPECT_FALSE(plain->reliableUDP());
  EXPECT_EQ(plain->displayURL(), "http://show");
}

TEST_F(DashboardBackendTest, SendsEachEventAndReturnsItsLine) {
  const auto payload = std::make_shared<const Dictionary>(Dictionary{{"b", "xyz"}, {"a", "q"}});
  const auto plain = make(profile());
  EXPECT_EQ(send(*plain, payload), "123.000 D 127.0.0.1 XF     0     1     1     5     6  a=q b=xyz");
  const auto packet = received();
  EXPECT_EQ(packet.text, " a=q b=xyz");
  EXPECT_EQ(packet.header.versionMajor, 8);
  EXPECT_EQ(packet.header.mode, 0);
  EXPECT_EQ(send(*plain, std::make_shared<const Dictionary>(Dictionary{{"k", std::string(1019, 'x') + "é"}})),
            std::nullopt);
  EXPECT_EQ(received().header.eventNumber, 2);

  const auto reliable = make(profile({{"reliable", 60'000}}));
  send(*reliable);
  EXPECT_EQ(received().header.mode, 1);
  auto explicitServer = DashboardBackend::create(platform, "dashboard", "127.0.0.1", server.port(), {});
  send(*explicitServer);
  EXPECT_EQ(received().header.mode, 3);
  EXPECT_TRUE(platform.services.pendingDatagrams.waitUntilSent(test::kHangGuard));
  server.send({});                                // no end of anything
  std::vector<std::uint8_t> acknowledgement(62);  // as short as it may be
  acknowledgement[61] = 1;
  server.send(acknowledgement);
  EXPECT_TRUE(goes(explicitServer));
  reliable->cleanup();  // the platform ends while its datagram waits
}

TEST_F(DashboardBackendTest, WhatAServerRefusesIsSentAgainWhenItIsBack) {
  const std::uint16_t port = test::UdpServer().port();
  auto backend = make(profile({{"port", static_cast<int>(port)}, {"reliable", 200}}));
  send(*backend);  // nobody there: the next send fails
  send(*backend);
  ASSERT_TRUE(platform.services.pendingDatagrams.waitUntilSent(test::kHangGuard));
  const std::weak_ptr<DashboardBackend> weak = backend;
  backend->cleanup();  // with both still to be sent
  backend.reset();
  test::UdpServer late(port);
  std::map<int, int> seen;
  while (seen.size() < 2) {
    const auto datagram = late.receive();
    ASSERT_TRUE(datagram);
    ++seen[decodeDashboardDatagram(*datagram)->header.eventNumber];
    late.send(*datagram);
  }
  EXPECT_TRUE(eventually([&] { return weak.expired(); }));
  EXPECT_EQ(log.count("<7>DashboardBackend(myPeriodicTask): clean up at myPeriodicTask."), 1U);
}

TEST_F(DashboardBackendTest, CleanUpWithAnEmptyQueueClosesAtOnceAndSendsGoNowhere) {
  const std::size_t before = openSockets();
  const auto backend = make(profile({{"reliable", 60'000}}));
  EXPECT_EQ(openSockets(), before + 1);
  backend->cleanup();
  backend->cleanup();
  ASSERT_TRUE(eventually([&] { return openSockets() == before; }));
  EXPECT_TRUE(send(*backend));
  EXPECT_TRUE(platform.services.pendingDatagrams.waitUntilSent(test::kHangGuard));
  EXPECT_EQ(server.receive(0), std::nullopt);
  EXPECT_EQ(log.count("clean-up"), 0U);
  const test::UdpServer another;  // under the descriptor that has become free
  backend->cleanup();
  EXPECT_TRUE(eventually([&] { return backend.use_count() == 1; }));
  EXPECT_EQ(openSockets(), before + 1);
  EXPECT_EQ(gCancelledTooLate, 0);
}

TEST_F(DashboardBackendTest, TheLastResortClosesWhatASilentServerKeepsOpen) {
  const std::size_t before = openSockets();
  auto backend = make(profile({{"reliable", 1000}}));  // given up after 20 s
  send(*backend);
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_TRUE(goes(backend));
  EXPECT_GE(std::chrono::steady_clock::now() - begin, DashboardBackend::kLastResortDelay);
  EXPECT_EQ(openSockets(), before);
  EXPECT_EQ(log.count("clean up at myPeriodicTask"), 0U);
  EXPECT_EQ(log.count("<7>DashboardBackend(myPeriodicTask): scheduled last resort clean-up in 9500 ms."), 1U);
}

TEST_F(DashboardBackendTest, LogDataThatDoesNotArrive) {
  using test::ScriptedHttpClient;
  const auto good = std::make_shared<const Array>(Array{1});
  const auto backend = make(profile({{"post_url", "http://logs.example/post"}}));
  const std::tuple<Backend, SharedArray, platform::HttpResult, std::string> rows[] = {
      {make(profile()), good, {}, "Post URL for log data array is nil"},
      {backend, std::make_shared<const Array>(Array{nullptr}), {}, "Failed to serialize log data array for upload"},
      {backend, good, {std::nullopt, "no route"}, "Error uploading log data array (no route)"},
      {backend, good, ScriptedHttpClient::status(200), "Error uploading log data array ((null))"},
      {backend, good, ScriptedHttpClient::status(200, "\xff"), "Error uploading log data array ((null))"},
  };
  for (const auto& row : rows) {
    const auto& [uploader, logData, answer, line] = row;
    log.clear();
    platform.http.answer = [&row](const auto&) { return std::get<2>(row); };
    EXPECT_FALSE(uploader->uploadLogData(logData)) << line;
    EXPECT_EQ(log.lines().at(0), "<3>DashboardBackend(uploadLogData): " + line);
  }
  EXPECT_TRUE(platform.services.pendingDatagrams.waitUntilSent(test::kHangGuard));
  EXPECT_EQ(server.receive(0), std::nullopt);
}

}  // namespace
}  // namespace orvanta
