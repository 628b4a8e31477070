#include "backends/DashboardBackend.h"

#include <gtest/gtest.h>
#include <sys/resource.h>

#include <algorithm>
#include <filesystem>
#include <map>
#include <random>

#include "backends/DashboardDatagram.h"
#include "platform/PropertyList.h"
#include "tests/platform/Waiting.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"
#include "tests/support/UdpServer.h"

namespace orvanta {
namespace {

using platform::Array;
using platform::Dictionary;
using test::eventually;

class DashboardBackendTest : public ::testing::Test {
 protected:
  using Backend = std::shared_ptr<DashboardBackend>;

  Dictionary profile(Dictionary more = {}) const {
    Dictionary all{{"ip", "127.0.0.1"}, {"port", static_cast<int>(server.port())}};
    all.merge(more);
    return all;
  }
  Backend make(const Dictionary& content) {
    auto backend =
        DashboardBackend::create(platform, "dashboard", std::make_shared<const Dictionary>(content), "Parva");
    if (backend) identify(*backend);
    return backend;
  }
  static void identify(DashboardBackend& backend) {
    BackendIdentity identity;
    identity.sessionID = 1;
    identity.compType = 7;
    identity.udid = "D";
    identity.selfVersion = "8.0";
    backend.setIdentity(std::move(identity));
  }
  static std::optional<std::string> send(DashboardBackend& backend, SharedDictionary payload = nullptr) {
    return backend.sendMessage(payload, {123, 0}, 5, 6, 0);
  }
  // The next datagram taken apart.
  tagReportingPacket received() {
    const auto datagram = server.receive();
    EXPECT_TRUE(datagram) << "no datagram came";
    const auto packet = decodeDashboardDatagram(datagram.value_or(std::vector<std::uint8_t>()));
    return packet ? *packet : tagReportingPacket{};
  }
  static std::array<std::uint8_t, 64> acknowledgement(std::uint16_t number) {
    std::array<std::uint8_t, 64> datagram{};
    datagram[60] = static_cast<std::uint8_t>(number >> 8U);
    datagram[61] = static_cast<std::uint8_t>(number);
    return datagram;
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

  test::TestPlatform platform;
  test::UdpServer server;
  test::LogCapture log;
};

TEST_F(DashboardBackendTest, SetUpFailuresLeaveOneLineAndNoSocket) {
  const std::size_t before = openSockets();
  const std::pair<Dictionary, std::string> rows[] = {
      {{}, "can't resolve server IP"},
      {{{"port", 1}}, "can't resolve server IP"},
      {{{"ip", nullptr}, {"port", 1}}, "can't resolve server IP"},
      {{{"ip", "127.0.0.1"}}, "can't resolve server port"},
      {{{"ip", "localhost"}, {"port", 1}}, "socket connect() failed."},
      {{{"ip", "127.0.0.1 and more"}, {"port", 1}, {"reliable", 5}}, "socket connect() failed."},
      {{{"ip", Array{}}, {"port", 1}}, "socket connect() failed."},
  };
  for (const auto& [content, line] : rows) {
    log.clear();
    EXPECT_EQ(make(content), nullptr) << line;
    EXPECT_EQ(log.lines(), std::vector<std::string>{"<3>DashboardBackend(initWithName): " + line});
  }
  log.clear();
  EXPECT_EQ(DashboardBackend::create(platform, "dashboard", nullptr, "Parva"), nullptr);
  EXPECT_EQ(log.lines(),
            std::vector<std::string>{"<3>DashboardBackend(initWithName): initWitName with all null params."});
  log.clear();
  EXPECT_EQ(DashboardBackend::create(platform, "dashboard", std::nullopt, 1, "Parva"), nullptr);
  EXPECT_TRUE(log.lines().empty());
  EXPECT_EQ(openSockets(), before);

  rlimit limit{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &limit), 0);
  const rlimit none{0, limit.rlim_max};
  ::setrlimit(RLIMIT_NOFILE, &none);
  EXPECT_EQ(make(profile()), nullptr);
  ::setrlimit(RLIMIT_NOFILE, &limit);
  EXPECT_EQ(log.lines(), std::vector<std::string>{"<3>DashboardBackend(initWithName): socket() failed (24)"});
}

TEST_F(DashboardBackendTest, SettingsFromTheProfile) {
  const struct {
    platform::Value reliable;
    int period;
    bool warns;
  } rows[] = {{250, 250, false}, {"20", 20, false},         {0, 500, true},      {-3, 500, true},
              {true, 500, true}, {1e300, 86'400'000, true}, {Array{}, 500, true}};
  for (const auto& row : rows) {
    log.clear();
    auto backend = make(profile({{"reliable", row.reliable}}));
    EXPECT_EQ(backend->period().count(), row.period) << row.reliable.description();
    EXPECT_TRUE(backend->reliableUDP());
    EXPECT_EQ(log.count("<4>"), row.warns ? 1U : 0U);
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
  auto explicitServer = DashboardBackend::create(platform, "dashboard", "127.0.0.1", server.port(), "Parva");
  send(*explicitServer);
  EXPECT_EQ(received().header.mode, 3);
  EXPECT_TRUE(DashboardBackend::waitUntilSent(platform, test::kHangGuard));
  server.send(acknowledgement(1));
  EXPECT_TRUE(goes(explicitServer));
  reliable->cleanup();  // the platform ends while its datagram waits
}

TEST_F(DashboardBackendTest, WhatAServerRefusesIsSentAgainWhenItIsBack) {
  const std::uint16_t port = test::UdpServer().port();
  auto backend = make(profile({{"port", static_cast<int>(port)}, {"reliable", 200}}));
  send(*backend);  // nobody there: the next send fails
  send(*backend);
  ASSERT_TRUE(DashboardBackend::waitUntilSent(platform, test::kHangGuard));
  test::UdpServer late(port);
  std::map<int, int> seen;
  while (seen.size() < 2) {
    const auto datagram = late.receive();
    ASSERT_TRUE(datagram);
    ++seen[decodeDashboardDatagram(*datagram)->header.eventNumber];
    late.send(*datagram);
  }
  EXPECT_TRUE(goes(backend));
}

TEST_F(DashboardBackendTest, NothingIsLostWhenAcknowledgementsAre) {
  const unsigned seed = std::random_device()();
  SCOPED_TRACE("seed " + std::to_string(seed));
  std::mt19937 random(seed);
  const std::size_t before = openSockets();
  auto backend = make(profile({{"reliable", 5}}));
  constexpr int kEvents = 40;
  for (int i = 0; i < kEvents; ++i) send(*backend);
  const std::weak_ptr<DashboardBackend> weak = backend;
  backend->cleanup();
  std::map<int, int> transmissions;
  backend.reset();
  // What went out before the backend did is all in the server's socket by then.
  for (bool gone = false; !gone;) {
    gone = weak.expired();
    while (const auto datagram = server.receive(1)) {
      const auto packet = decodeDashboardDatagram(*datagram);
      ASSERT_TRUE(packet) << packet.error();
      ++transmissions[packet->header.eventNumber];
      if (random() % 10 >= 3) server.send(*datagram);
    }
  }
  EXPECT_EQ(transmissions.size(), static_cast<std::size_t>(kEvents));
  for (const auto& [number, count] : transmissions) EXPECT_LE(count, 5) << "event " << number;
  EXPECT_EQ(openSockets(), before);
  EXPECT_EQ(log.count("<7>DashboardBackend(myPeriodicTask): clean up at myPeriodicTask."), 1U);
  EXPECT_EQ(log.count("<7>DashboardBackend(myPeriodicTask): scheduled last resort clean-up in 9500 ms."), 1U);
}

TEST_F(DashboardBackendTest, OnlyTheServersAcknowledgementOfThatNumberCounts) {
  auto backend = make(profile({{"reliable", 100}}));
  send(*backend);
  const auto datagram = server.receive();
  ASSERT_TRUE(datagram);
  test::UdpServer stranger;
  stranger.sendTo(server.sender(), *datagram);  // forged: from another address
  server.send({});
  server.send(std::vector<std::uint8_t>(61, 0));  // one byte short of a number
  server.send(std::vector<std::uint8_t>(2000, 0));
  for (int i = 0; i < 100'000; ++i) server.send(acknowledgement(static_cast<std::uint16_t>(i | 2)));
  // The flood leaves other queues their turn, and the datagram its schedule.
  EXPECT_TRUE(DashboardBackend::waitUntilSent(platform, test::kHangGuard));
  EXPECT_EQ(server.receive(), datagram);
  std::vector<std::uint8_t> shortest(62, 0);
  shortest[61] = 1;
  server.send(shortest);
  EXPECT_TRUE(goes(backend));
}

TEST_F(DashboardBackendTest, CleanUpWithAnEmptyQueueClosesAtOnceAndSendsGoNowhere) {
  const std::size_t before = openSockets();
  const auto backend = make(profile({{"reliable", 60'000}}));
  EXPECT_EQ(openSockets(), before + 1);
  backend->cleanup();
  backend->cleanup();
  ASSERT_TRUE(eventually([&] { return openSockets() == before; }));
  EXPECT_TRUE(send(*backend));
  EXPECT_TRUE(DashboardBackend::waitUntilSent(platform, test::kHangGuard));
  EXPECT_EQ(server.receive(0), std::nullopt);
  EXPECT_EQ(log.count("clean-up"), 0U);
  EXPECT_TRUE(eventually([&] { return backend.use_count() == 1; }));
}

TEST_F(DashboardBackendTest, TheLastResortClosesWhatASilentServerKeepsOpen) {
  const std::size_t before = openSockets();
  auto backend = make(profile({{"reliable", 1000}}));  // given up after 20 s
  send(*backend);
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_TRUE(goes(backend));
  EXPECT_GE(std::chrono::steady_clock::now() - begin, DashboardBackend::kLastResortDelay);
  EXPECT_EQ(openSockets(), before);
  EXPECT_EQ(log.count("<7>DashboardBackend(myPeriodicTask): scheduled last resort clean-up in 9500 ms."), 1U);
  EXPECT_EQ(log.count("clean up at myPeriodicTask"), 0U);
}

TEST_F(DashboardBackendTest, AThousandBackendsLeaveNothingBehind) {
  const std::size_t before = openSockets();
  const std::size_t threads = platform.get().pool().threadCount();
  for (int round = 0; round < 10; ++round) {  // a hundred at a time, below any limit on descriptors
    std::vector<std::weak_ptr<DashboardBackend>> weak;
    for (int i = 0; i < 100; ++i) {
      const auto backend = make(i % 3 == 0 ? profile() : profile({{"reliable", 2}}));
      ASSERT_NE(backend, nullptr);
      send(*backend);
      weak.emplace_back(backend);
      backend->cleanup();
    }
    const auto gone = [&] { return std::all_of(weak.begin(), weak.end(), [](auto& w) { return w.expired(); }); };
    ASSERT_TRUE(eventually(gone));
  }
  EXPECT_EQ(openSockets(), before);
  EXPECT_EQ(platform.get().pool().threadCount(), threads);
}

TEST_F(DashboardBackendTest, UploadsLogDataAndAnnouncesWhere) {
  using test::ScriptedHttpClient;
  const auto logData = std::make_shared<const Array>(Array{1, "text", Dictionary{{"k", 2.5}}});
  const auto backend = make(profile({{"post_url", "http://logs.example/post"}}));
  platform.http.answer = [](const auto&) { return ScriptedHttpClient::status(200, "http://logs.example/42"); };
  platform.clock.set(77);
  EXPECT_TRUE(backend->uploadLogData(logData));
  const auto request = platform.http.requests().at(0);
  EXPECT_EQ(request.method + " " + request.url, "POST http://logs.example/post");
  ASSERT_EQ(request.headers.size(), 1U);
  EXPECT_EQ(request.headers[0].name + ": " + request.headers[0].value, "Content-Type: application/octet-stream");
  const auto archive = platform::parseBinaryPropertyList(
      {reinterpret_cast<const std::uint8_t*>(request.body.data()), request.body.size()});
  ASSERT_TRUE(archive) << archive.error();
  EXPECT_EQ(*archive, Dictionary({{"archiver", "OrvantaArchiver"}, {"version", 1}, {"root", *logData}}));
  const auto packet = received();
  EXPECT_EQ(packet.text, " LogDataUploadLocation=http://logs.example/42");
  EXPECT_EQ(packet.header.eventNumber, 1);
  EXPECT_EQ(packet.header.method, 0);
  EXPECT_EQ(packet.header.respCode, 2);
  EXPECT_EQ(packet.header.timeSeconds, 77U);
  EXPECT_EQ(log.lines(), std::vector<std::string>{
                             "<7>DashboardBackend(uploadLogData): Log data uploaded to http://logs.example/42"});
}

TEST_F(DashboardBackendTest, LogDataThatDoesNotArrive) {
  using test::ScriptedHttpClient;
  const auto good = std::make_shared<const Array>(Array{1});
  const auto backend = make(profile({{"post_url", "http://logs.example/post"}}));
  const struct {
    Backend backend;
    SharedArray logData;
    platform::HttpResult answer;
    std::string line;
  } rows[] = {
      {make(profile()), good, {}, "Post URL for log data array is nil"},
      {backend, std::make_shared<const Array>(Array{nullptr}), {}, "Failed to serialize log data array for upload"},
      {backend, good, {std::nullopt, "no route"}, "Error uploading log data array (no route)"},
      {backend, good, ScriptedHttpClient::status(200), "Error uploading log data array ((null))"},
      {backend, good, ScriptedHttpClient::status(200, "\xff"), "Error uploading log data array ((null))"},
  };
  for (const auto& row : rows) {
    log.clear();
    platform.http.answer = [&row](const auto&) { return row.answer; };
    EXPECT_FALSE(row.backend->uploadLogData(row.logData)) << row.line;
    EXPECT_EQ(log.lines().at(0), "<3>DashboardBackend(uploadLogData): " + row.line);
  }
  EXPECT_TRUE(DashboardBackend::waitUntilSent(platform, test::kHangGuard));
  EXPECT_EQ(server.receive(0), std::nullopt);
}

}  // namespace
}  // namespace orvanta
