#include "tools/collector/DashboardServer.h"

#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <poll.h>
#include <sys/socket.h>

#include <string>

#include "backends/DashboardDatagram.h"
#include "tests/tools/CollectorFixture.h"
#include "tools/collector/Sockets.h"

namespace orvanta::collector {
namespace {

// A daemon's side: an unconnected socket, so that forged acknowledgements from elsewhere show too.
class DashboardServerTest : public CollectorFixture {
 protected:
  struct Acknowledgement {
    std::uint16_t port = 0;  // of the sender
    std::string bytes;
  };

  void SetUp() override {
    CollectorFixture::SetUp();
    auto bound = bindSocket(SOCK_DGRAM, "127.0.0.1", 0);
    ASSERT_TRUE(bound) << bound.error();
    _socket = std::move(bound->socket);
  }
  static std::string datagram(std::uint16_t eventNumber, bool reliable = true) {
    const Dictionary payload{{"a", "q"}, {"b", "x=y"}};
    DashboardSender sender;
    sender.mode = reliable ? 1 : 0;
    const auto bytes = encodeDashboardDatagram(sender, {&payload, {123, 4999}, 300, 2, eventNumber});
    return {bytes.begin(), bytes.end()};
  }
  void send(const std::string& bytes) const {
    sockaddr_in to{};
    to.sin_family = AF_INET;
    to.sin_port = htons(collector->dashboardPort());
    to.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    ASSERT_EQ(::sendto(_socket.get(), bytes.data(), bytes.size(), 0, reinterpret_cast<sockaddr*>(&to), sizeof to),
              static_cast<ssize_t>(bytes.size()));
  }
  // The next acknowledgement; one without bytes when none comes.
  Acknowledgement receive() const {
    if (!waits(kPatience)) return {};
    std::array<char, 2048> buffer{};
    sockaddr_in from{};
    socklen_t size = sizeof from;
    const ssize_t count =
        ::recvfrom(_socket.get(), buffer.data(), buffer.size(), 0, reinterpret_cast<sockaddr*>(&from), &size);
    return {ntohs(from.sin_port), std::string(buffer.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0)))};
  }
  // Whether something can be read within the time.
  bool waits(std::chrono::milliseconds patience = {}) const {
    pollfd waiting{_socket.get(), POLLIN, 0};
    return ::poll(&waiting, 1, static_cast<int>(patience.count())) > 0;
  }

 private:
  platform::UniqueFd _socket;
};

TEST_F(DashboardServerTest, DecodesAndAcknowledges) {
  const std::string sent = datagram(513);
  send(sent);
  const auto answer = receive();
  EXPECT_EQ(answer.port, collector->dashboardPort());
  EXPECT_EQ(answer.bytes, sent.substr(0, 64));
  ASSERT_TRUE(collector->waitForDatagrams(1, kPatience));
  const auto received = collector->datagrams()[0];
  EXPECT_EQ(received.bytes, sent);
  EXPECT_EQ(received.eventNumber, 513);
  EXPECT_EQ(received.milliseconds, 4);
  EXPECT_EQ(received.acknowledgements, 1);
  const auto datagrams = list("/datagrams");
  const auto& listed = at(at(datagrams, "datagrams"), 0);
  EXPECT_EQ(at(listed, "values"), (Dictionary{{"a", "q"}, {"b", "x=y"}}));
  EXPECT_EQ(at(listed, "reliable"), true);
}

TEST_F(DashboardServerTest, AcknowledgesOnlyWhatAsksForIt) {
  send(datagram(1, false));
  send("short");
  send(datagram(2).substr(0, 64));  // tells a longer length
  send(datagram(3));
  EXPECT_EQ(receive().bytes, datagram(3).substr(0, 64));
  EXPECT_FALSE(waits());
  ASSERT_TRUE(collector->waitForDatagrams(4, kPatience));
  const auto received = collector->datagrams();
  EXPECT_TRUE(received[0].wellFormed);
  EXPECT_FALSE(received[1].wellFormed);
  EXPECT_EQ(received[1].bytes, "short");
  EXPECT_FALSE(received[2].wellFormed);
}

TEST_F(DashboardServerTest, ForgesAndRepeatsAsAsked) {
  AcknowledgementSettings settings;
  settings.duplicates = settings.unknownNumbers = settings.tooShort = settings.foreign = 1;
  collector->setAcknowledgements(settings);
  const std::string right = datagram(9).substr(0, 64);
  send(datagram(9));
  std::vector<std::string> fromServer;
  std::vector<std::string> fromElsewhere;
  for (int i = 0; i < 5; ++i) {
    const auto answer = receive();
    (answer.port == collector->dashboardPort() ? fromServer : fromElsewhere).push_back(answer.bytes);
  }
  EXPECT_FALSE(waits());
  EXPECT_THAT(fromElsewhere, testing::ElementsAre(right));
  ASSERT_EQ(fromServer.size(), 4U);
  EXPECT_EQ(fromServer[0].size(), 64U);
  EXPECT_NE(fromServer[0].substr(60, 2), right.substr(60, 2));
  EXPECT_EQ(fromServer[1].size(), 61U);
  EXPECT_EQ(fromServer[2], right);
  EXPECT_EQ(fromServer[3], right);
}

}  // namespace
}  // namespace orvanta::collector
