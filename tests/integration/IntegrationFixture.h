#pragma once

#include <gtest/gtest.h>

#include <fstream>
#include <functional>
#include <iterator>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "client/OrvantaClient.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/TemporaryDirectory.h"
#include "tools/collector/Collector.h"

namespace orvanta::test {

using collector::Collector;
using collector::RequestKind;

// The real daemon, in its sandbox, and the collector as everything that it talks to. A test sets `options` and the
// section, then calls startDaemon().
class IntegrationFixture : public ::testing::Test {
 protected:
  static constexpr std::chrono::seconds kTimeout{60};

  // A device with consent, so that nothing but what a test changes keeps events back.
  IntegrationFixture() {
    options.device = {{"UniqueDeviceID", "00112233445566778899aabbccddeeff00112233"},
                      {"ProductVersion", "12.5"},
                      {"BuildVersion", "12F5"},
                      {"ProductType", "Parva3,2"},
                      {"DeviceName", "Parva"},
                      {"CountryCode", "DE"},
                      {"DiagnosticsSubmissionAllowed", true}};
  }
  void SetUp() override { startCollector({}); }

  void startCollector(collector::CollectorOptions collectorOptions) {
    server.reset();
    collectorOptions.directory = _directory / "collector";
    auto started = Collector::start(std::move(collectorOptions));
    ASSERT_TRUE(started) << started.error();
    server = std::move(*started);
    setSection({{"http_post", httpPost(clientSection())}});
    options.storebagURL = server->storebagURL();
    options.publicKey = fileBytes(server->publicKeyFile());
    options.caFile = server->caFile();
  }
  void startDaemon() {
    daemon = std::make_unique<DaemonProcess>(options);
    ASSERT_TRUE(daemon->start()) << daemon->process().allLines();
  }
  // With a log that costs nothing.
  void startQuietDaemon() {
    options.logLevel = "4";
    daemon = std::make_unique<DaemonProcess>(options);
    ASSERT_TRUE(daemon->startQuietly());
  }
  void TearDown() override {
    if (daemon && !daemon->process().exitStatus()) {
      EXPECT_EQ(daemon->terminate(), 0) << daemon->process().allLines();
    }
    if (HasFailure() && daemon) std::fputs(daemon->process().allLines().c_str(), stderr);
  }

  // A section of the storebag's "clients", posting to the collector over https, with `more` on top.
  Dictionary clientSection(const Dictionary& more = {}) const {
    Dictionary section{{"post_url", server->eventsURL()}, {"realtime_post_url", server->eventsURL() + "/realtime"},
                       {"locale_whitelist", Array{"DE"}}, {"filters", Array{}},
                       {"sampling_threshold", 1.0},       {"event_threshold", 49}};
    section.merge(more);
    return section;
  }
  static Dictionary httpPost(Dictionary section) { return {{"clients", Array{std::move(section)}}}; }
  void setSection(Dictionary section) { server->setSection(std::move(section)); }

  std::unique_ptr<OrvantaConnection> connect() {
    ConnectionOptions connection;
    connection.socketDirectory = daemon->runtimeDirectory();
    auto connected = OrvantaConnection::connect(std::move(connection));
    EXPECT_TRUE(connected) << connected.error().text;
    return connected ? std::move(*connected) : nullptr;
  }
  // A program of the build as a child of this daemon's surroundings.
  ChildProcess::Options program(const std::string& name, std::vector<std::string> arguments = {}) const {
    ChildProcess::Options child;
    child.program = DaemonProcess::programPath(name);
    child.arguments = std::move(arguments);
    child.environment = daemon->environment();
    return child;
  }
  // Connects and configures; `names` gets what the daemon answered.
  std::unique_ptr<OrvantaConnection> openSession(SessionInfo info, const std::optional<UserInfo>& user = {},
                                                 BackendNames* names = nullptr) {
    auto connection = connect();
    if (!connection) return nullptr;
    if (info.clientType == 0) info.clientType = 5;
    auto answer = connection->session().blocking().configure(info, user);
    EXPECT_TRUE(answer) << answer.error().text;
    if (answer && names != nullptr) *names = *answer;
    return connection;
  }
  static MessageParameters event(std::uint16_t category, std::uint16_t type, Dictionary payload = {}) {
    return {.category = category, .type = type, .payload = std::move(payload)};
  }
  static std::int64_t number(const collector::ReceivedEvent& received, std::string_view key) {
    const Value* value = received.event.find(key);
    return value == nullptr ? -1 : value->integerValue();
  }
  static std::optional<std::string> send(OrvantaConnection& connection, const MessageParameters& parameters) {
    auto reply = connection.session().blocking().sendMessage(parameters);
    EXPECT_TRUE(reply) << reply.error().text;
    return reply ? *reply : std::nullopt;
  }
  static FlushAnswer flush(OrvantaConnection& connection) {
    auto answer = connection.session().blocking().flushMessages();
    EXPECT_TRUE(answer) << answer.error().text;
    return answer ? *answer : FlushAnswer{};
  }
  // The events received so far whose category is not 0, the sessions' own.
  std::vector<collector::ReceivedEvent> clientEvents() {
    std::vector<collector::ReceivedEvent> found;
    for (auto& received : server->events()) {
      if (number(received, "_method") != 0) found.push_back(std::move(received));
    }
    return found;
  }
  bool waitForClientEvents(std::size_t count) {
    return server->inbox().waitUntil([this, count] { return clientEvents().size() >= count; }, kTimeout);
  }
  static std::vector<std::uint8_t> fileBytes(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), {}};
  }

  std::unique_ptr<Collector> server;
  DaemonProcess::Options options;
  std::unique_ptr<DaemonProcess> daemon;

 private:
  TemporaryDirectory _directory;
};

}  // namespace orvanta::test
