#include "backends/ReliableDelivery.h"

#include <gtest/gtest.h>

#include <string>

namespace orvanta {
namespace {

// Drives a delivery as a backend would, and notes on which ticks which datagram went out.
struct Scenario {
  explicit Scenario(bool acknowledged) {
    if (acknowledged) delivery.useAcknowledgements();
  }
  bool transmit(std::span<const std::uint8_t> datagram) {
    ++attempts;
    if (!networkUp) return false;
    sends += std::to_string(datagram[0]) + "@" + std::to_string(now) + " ";
    return true;
  }
  // The datagram's only byte tells datagrams of one event number apart.
  void send(std::uint8_t mark, std::uint16_t eventNumber) {
    const std::vector<std::uint8_t> datagram{mark};
    delivery.sent(datagram, eventNumber, transmit(datagram));
  }
  void tick(int count = 1) {
    for (; count > 0; --count) {
      ++now;
      delivery.tick([this](std::span<const std::uint8_t> datagram) { return transmit(datagram); });
    }
  }
  std::string waiting() const {
    std::string marks;
    for (const auto& packet : delivery.messageQueue()) marks += std::to_string(packet.data[0]) + " ";
    return marks;
  }

  ReliableDelivery delivery;
  bool networkUp = true;
  int now = 0;
  int attempts = 0;
  std::string sends;
};

TEST(ReliableDelivery, WholeScheduleWithASilentServer) {
  Scenario scenario(true);
  scenario.send(1, 1);
  scenario.tick(19);
  EXPECT_EQ(scenario.sends, "1@0 1@2 1@5 1@10 1@19 ");
  EXPECT_EQ(scenario.waiting(), "1 ");
  scenario.tick();
  EXPECT_TRUE(scenario.delivery.empty());
  scenario.tick(30);
  EXPECT_EQ(scenario.attempts, 5);
}

TEST(ReliableDelivery, AcknowledgementsRemoveTheOldestOfTheirNumberOnly) {
  Scenario scenario(true);
  scenario.send(1, 65535);
  scenario.send(2, 0);
  scenario.send(3, 65535);  // the counter has come round
  EXPECT_FALSE(scenario.delivery.acknowledged(1));
  EXPECT_EQ(scenario.waiting(), "1 2 3 ");
  EXPECT_TRUE(scenario.delivery.acknowledged(65535));
  EXPECT_EQ(scenario.waiting(), "2 3 ");
  EXPECT_TRUE(scenario.delivery.acknowledged(65535));
  EXPECT_FALSE(scenario.delivery.acknowledged(65535));
  EXPECT_EQ(scenario.waiting(), "2 ");
  scenario.tick(2);
  EXPECT_EQ(scenario.sends, "1@0 2@0 3@0 2@2 ");
}

TEST(ReliableDelivery, PlainModeKeepsOnlyWhatCouldNotBeSent) {
  Scenario scenario(false);
  scenario.send(1, 1);
  EXPECT_TRUE(scenario.delivery.empty());
  scenario.networkUp = false;
  scenario.send(2, 2);
  scenario.send(3, 3);
  scenario.tick(30);
  EXPECT_EQ(scenario.waiting(), "2 3 ");
  scenario.networkUp = true;
  scenario.tick();
  EXPECT_EQ(scenario.sends, "1@0 2@31 3@31 ");
  EXPECT_TRUE(scenario.delivery.empty());
}

TEST(ReliableDelivery, AFailedFirstSendStartsTheScheduleWhenItSucceeds) {
  Scenario scenario(true);
  scenario.networkUp = false;
  scenario.send(1, 1);
  scenario.send(2, 7);
  EXPECT_TRUE(scenario.delivery.acknowledged(7)) << "though it was never sent";
  scenario.tick(3);
  scenario.networkUp = true;
  scenario.tick(20);
  EXPECT_EQ(scenario.sends, "1@4 1@6 1@9 1@14 1@23 ");
  EXPECT_EQ(scenario.waiting(), "1 ");
  scenario.tick();
  EXPECT_TRUE(scenario.delivery.empty());
}

TEST(ReliableDelivery, AFailedResendIsTriedOnEveryTickAndDelaysTheRest) {
  Scenario scenario(true);
  scenario.send(1, 1);
  scenario.tick();
  scenario.networkUp = false;
  scenario.tick(3);  // due on tick 2
  EXPECT_EQ(scenario.attempts, 4);
  scenario.networkUp = true;
  scenario.tick(4);
  EXPECT_EQ(scenario.sends, "1@0 1@5 1@8 ");
}

TEST(ReliableDelivery, TheFiftyFirstDropsTheOldestWhateverItsState) {
  Scenario scenario(true);
  const auto oldest = [&] { return scenario.delivery.messageQueue().front().data[0]; };
  scenario.send(1, 1);
  scenario.tick(2);
  scenario.networkUp = false;
  for (std::uint8_t i = 2; i <= 50; ++i) scenario.send(i, i);
  EXPECT_EQ(oldest(), 1);
  scenario.networkUp = true;
  scenario.send(51, 51);  // drops one that is being retransmitted
  EXPECT_EQ(oldest(), 2);
  scenario.send(52, 52);  // and one that has never been sent
  EXPECT_EQ(oldest(), 3);
  EXPECT_EQ(scenario.delivery.messageQueue().size(), 50U);
}

TEST(ReliableDelivery, GivingUpOneLeavesItsNeighboursSchedulesAlone) {
  Scenario scenario(true);
  scenario.send(1, 1);
  scenario.tick(18);
  scenario.send(2, 2);
  scenario.sends.clear();
  scenario.tick(2);  // 1 is resent, then given up in the tick that resends 2
  EXPECT_EQ(scenario.sends, "1@19 2@20 ");
  EXPECT_EQ(scenario.waiting(), "2 ");
}

}  // namespace
}  // namespace orvanta
