#include <vector>

#include "tests/client/ClientFixture.h"

namespace orvanta::test {
namespace {

class Aggregation : public ClientFixture {
 protected:
  Aggregation() {
    session().setAggregationHandler(
        [this](const AggregatedEvent& event) { _seen.push_back(std::to_string(event.category)); },
        [this] { _seen.push_back("end"); });
  }
  void TearDown() override { connection.reset(); }

  void sendEvent(int category) {
    peer->notify("sendMessageToClient", {Dictionary{{"sessionID", 5}}, 12.5, category, 2, Dictionary{{"a", 1}}});
  }
  void sendEnd() { peer->notify("sendMessageToClient", {nullptr, 0.0, 0, 0, nullptr}); }
  // The handlers' calls so far; waits for those of everything that the daemon has sent.
  std::vector<std::string> seen() {
    std::promise<std::vector<std::string>> promise;
    session().fetchDisplayURL(StringReply([&](StringReply::Outcome) { promise.set_value(_seen); }));
    peer->answer(peer->expect("fetchDisplayURL"), {"URL"});
    auto future = promise.get_future();
    return within(future);
  }

 private:
  std::vector<std::string> _seen;  // on the callback thread
};

using Seen = std::vector<std::string>;

TEST_F(Aggregation, eventsComeUntilTheEndNoticeAndAgainWhenTheSessionIsConfiguredAgain) {
  sendEvent(1);
  peer->notify("sendMessageToClient", {Dictionary{{"sessionID", 0}}, 0.0, 0, 0, nullptr});  // no end notice
  sendEnd();
  sendEvent(3);
  sendEnd();
  EXPECT_EQ(seen(), (Seen{"1", "0", "end"}));
  session().setSessionInfo(shared({}), nullptr, nullptr, true, {});
  peer->expect("setSessionInfo");
  sendEvent(4);
  sendEnd();
  EXPECT_EQ(seen(), (Seen{"1", "0", "end", "4", "end"}));
}

TEST_F(Aggregation, malformedEventsAreLeftOut) {
  const Array rows[] = {
      {Dictionary{}, 1.0, 1, 1},           {Dictionary{}, 1.0, 70'000, 1, nullptr},
      {Dictionary{}, 1.0, -1, 1, nullptr}, {Dictionary{}, "1.0", 1, 1, nullptr},
      {"info", 1.0, 1, 1, nullptr},        {Dictionary{}, 1.0, 1, 1, "payload"},
  };
  for (const auto& row : rows) peer->notify("sendMessageToClient", row);
  sendEvent(9);
  EXPECT_EQ(seen(), Seen{"9"});
}

TEST_F(Aggregation, theDaemonIsToldWhetherThereIsAHandler) {
  const auto toldWhenConfigured = [this] {
    auto configured = std::async(std::launch::async, [this] { return session().blocking().configure({}); });
    const auto set = peer->expect("setSessionInfo");
    peer->answer(set, {});
    peer->answer(peer->expect("startConfigWithCompletionHandler"), {nullptr});
    EXPECT_FALSE(within(configured).value());
    return set.params[3].boolValue();
  };
  EXPECT_TRUE(toldWhenConfigured());
  session().setAggregationHandler(nullptr, nullptr);
  EXPECT_FALSE(toldWhenConfigured());
}

}  // namespace
}  // namespace orvanta::test
