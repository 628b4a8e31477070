#include "tools/collector/servers/DashboardServer.h"

#include <gmock/gmock.h>

#include <string>

#include "backends/dashboard/DashboardDatagram.h"
#include "tests/support/Bytes.h"
#include "tests/support/UdpServer.h"
#include "tests/tools/CollectorFixture.h"

namespace orvanta::collector {
namespace {

// A daemon's side: an unconnected socket, so that it receives acknowledgements forged from another port too.
class DashboardServerTest : public CollectorFixture {
 protected:
  static std::string datagram(std::uint16_t eventNumber, bool reliable = true) {
    const auto payload = std::make_shared<const Dictionary>(Dictionary{{"a", "q"}, {"b", "x=y"}});
    DashboardSender sender;
    sender.mode = reliable ? 1 : 0;
    const auto bytes = encodeDashboardDatagram(sender, {payload, {123, 4999}, 300, 2, EventFlag::none, eventNumber});
    return {bytes.begin(), bytes.end()};
  }
  void send(const std::string& bytes) {
    sockaddr_in to{};
    to.sin_family = AF_INET;
    to.sin_port = htons(collector->dashboardPort());
    to.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    _socket.sendTo(to, test::bytesOf(bytes));
  }
  // The next acknowledgement; empty if the time is over first.
  std::string receive() {
    const auto datagram = _socket.receive();
    return datagram ? std::string(datagram->begin(), datagram->end()) : "";
  }
  bool waits() { return _socket.receive(0).has_value(); }
  // Of the acknowledgement received last.
  bool isFromElsewhere() const { return ntohs(_socket.sender().sin_port) != collector->dashboardPort(); }

 private:
  test::UdpServer _socket;
};

TEST_F(DashboardServerTest, AcknowledgesOnlyWhatAsksForIt) {
  send(datagram(1, false));
  send("short");
  send(datagram(2).substr(0, 64));  // its header says that it is longer
  send(datagram(3));
  EXPECT_EQ(receive(), datagram(3).substr(0, 64));
  EXPECT_FALSE(waits());
  ASSERT_TRUE(collector->waitForDatagrams(4, kTimeout));
  const auto received = collector->datagrams();
  EXPECT_TRUE(received[0].wellFormed && !received[1].wellFormed && !received[2].wellFormed);
  EXPECT_EQ(received[1].bytes, "short");
  EXPECT_EQ(at(at(at(list("/datagrams"), "datagrams"), 0), "values"), (Dictionary{{"a", "q"}, {"b", "x=y"}}));
}

TEST_F(DashboardServerTest, ForgesAndRepeatsAsAsked) {
  AcknowledgementSettings settings;
  settings.duplicates = settings.unknownNumbers = settings.tooShort = settings.foreign = 1;
  collector->setAcknowledgements(settings);
  const std::string right = datagram(9).substr(0, 64);
  send(datagram(9));
  std::vector<std::string> fromServer, fromElsewhere;
  for (int i = 0; i < 5; ++i) {
    const std::string answer = receive();
    (isFromElsewhere() ? fromElsewhere : fromServer).push_back(answer);
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
