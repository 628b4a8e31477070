#include "backends/dashboard/ReliableDelivery.h"

#include <gtest/gtest.h>

#include <sstream>
#include <string>

namespace orvanta {
namespace {

// Drives a delivery as a backend would, and notes which datagram went out (1@5: the first, on tick 5) or could not
// (1!5). Datagrams are told apart by their only byte, a count, since event numbers come round.
struct Scenario {
  explicit Scenario(bool acknowledged) {
    if (acknowledged) delivery.useAcknowledgements();
  }
  bool transmit(std::span<const std::uint8_t> datagram) {
    sends += std::to_string(datagram[0]) + (networkUp ? "@" : "!") + std::to_string(now) + " ";
    return networkUp;
  }
  // s7 sends a datagram of event 7, a7 acknowledges that number, n7 one that nothing waits for, t7 lets seven ticks
  // pass; - and + take the network down and up.
  void run(const std::string& script) {
    std::istringstream steps(script);
    for (std::string step; steps >> step;) {
      const auto number = static_cast<std::uint16_t>(std::atoi(step.c_str() + 1));
      if (step[0] == 's') {
        const std::vector<std::uint8_t> datagram{++count};
        delivery.sent(datagram, number, transmit(datagram));
      }
      if (step[0] == 'a' || step[0] == 'n') {
        EXPECT_EQ(delivery.acknowledged(number), step[0] == 'a') << script;
      }
      if (step[0] == '-' || step[0] == '+') networkUp = step[0] == '+';
      for (int i = 0; step[0] == 't' && i < number; ++i) {
        ++now;
        delivery.tick([this](std::span<const std::uint8_t> datagram) { return transmit(datagram); });
      }
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
  std::uint8_t count = 0;
  std::string sends;
};

TEST(ReliableDelivery, Schedules) {
  const std::string schedule = "1@0 1@2 1@5 1@10 1@19 ", late = "1!0 2!0 1!1 1!2 1!3 1@4 1@6 1@9 1@14 1@23 ";
  const std::string round = "s65535 s0 s65535 ";  // the counter has come round
  const struct {
    const char* what;
    bool acknowledged;
    std::string script, sends, waiting;
  } rows[] = {
      {"a silent server", true, "s1 t19", schedule, "1 "},
      {"gives up on tick 20", true, "s1 t20", schedule, ""},
      {"and is quiet then", true, "s1 t50", schedule, ""},
      {"another number", true, round + "n1", "1@0 2@0 3@0 ", "1 2 3 "},
      {"the oldest of its number only", true, round + "a65535", "1@0 2@0 3@0 ", "2 3 "},
      {"each once", true, round + "a65535 a65535 n65535 t2", "1@0 2@0 3@0 2@2 ", "2 "},
      {"plain", false, "s1", "1@0 ", ""},
      {"plain, what could not be sent waits", false, "s1 - s2 s3 t1", "1@0 2!0 3!0 2!1 3!1 ", "2 3 "},
      {"plain, and goes out", false, "s1 - s2 s3 t1 + t1", "1@0 2!0 3!0 2!1 3!1 2@2 3@2 ", ""},
      {"starts when the first send succeeds", true, "- s1 s7 a7 t3 + t20", late, "1 "},
      {"and ends as much later", true, "- s1 s7 a7 t3 + t21", late, ""},
      {"a failed resend delays the rest", true, "s1 t1 - t3 + t4", "1@0 1!2 1!3 1!4 1@5 1@8 ", "1 "},
      // 1 is resent, then given up in the tick that resends 2.
      {"neighbours", true, "s1 t18 s2 t2", "1@0 1@2 1@5 1@10 2@18 1@19 2@20 ", "2 "},
  };
  for (const auto& row : rows) {
    Scenario scenario(row.acknowledged);
    scenario.run(row.script);
    EXPECT_EQ(scenario.sends, row.sends) << row.what;
    EXPECT_EQ(scenario.waiting(), row.waiting) << row.what;
    EXPECT_EQ(scenario.delivery.empty(), row.waiting.empty()) << row.what;
  }
}

TEST(ReliableDelivery, TheFiftyFirstDropsTheOldestWhateverItsState) {
  Scenario scenario(true);
  scenario.run("s1 t2 -");
  for (int i = 2; i <= 50; ++i) scenario.run("s2");
  EXPECT_TRUE(scenario.waiting().starts_with("1 2 "));
  scenario.run("+ s51");  // drops one that is being retransmitted
  EXPECT_TRUE(scenario.waiting().starts_with("2 3 "));
  scenario.run("s52");  // and one that has never been sent
  EXPECT_TRUE(scenario.waiting().starts_with("3 4 "));
  EXPECT_EQ(scenario.delivery.messageQueue().size(), 50U);
}

}  // namespace
}  // namespace orvanta
