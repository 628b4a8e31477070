#include <gmock/gmock.h>

#include <future>

#include "tests/tools/CollectorFixture.h"

namespace orvanta::collector {
namespace {

const std::string kPost = R"({"events":[{"n":1}]})";

class CollectorFaultsTest : public CollectorFixture {
 protected:
  // Posts events and returns all bytes until the collector closes, with "[reset]" if it resets the connection.
  std::string rawAnswer(const std::string& path) const {
    return converse("POST " + path + " HTTP/1.1\r\nConnection: close\r\nContent-Length: " +
                    std::to_string(kPost.size()) + "\r\n\r\n" + kPost);
  }
  int control(const std::string& path, const std::string& json) const { return post(path, json)->status; }
};

TEST_F(CollectorFaultsTest, TakesTheExactPathBeforeTheLongestBeginning) {
  collector->setStatus("*", 500);
  collector->setStatus("/events/re*", 502);
  collector->setStatus("/events/realtime", 503, 1);
  EXPECT_EQ(post("/x", kPost)->status, 500);
  EXPECT_EQ(post("/events/rest", kPost)->status, 502);
  EXPECT_EQ(post("/events/realtime", kPost)->status, 503);
  EXPECT_EQ(post("/events/realtime", kPost)->status, 502) << "asked for once";
  EXPECT_EQ(http().Get("/control")->status, 200) << "the collector's own pages stay usable";
  collector->clearBehaviours();
  EXPECT_EQ(post("/x", kPost)->status, 200);
}

TEST_F(CollectorFaultsTest, BreaksAnswersAsAsked) {
  const std::string usual = rawAnswer("/events");
  ASSERT_THAT(usual, testing::EndsWith("{\"accepted\":1}\n"));
  const auto broken = [this](ConnectionFault fault) {
    collector->setFault("/events", fault);
    return rawAnswer("/events");
  };
  EXPECT_EQ(broken(ConnectionFault::reset), "[reset]");
  EXPECT_EQ(collector->requests().back().note, "reset");
  EXPECT_THAT(broken(ConnectionFault::truncate),
              testing::AllOf(testing::EndsWith("\r\n\r\n{\"accep"), testing::HasSubstr("Content-Length: 15\r\n")));
  EXPECT_THAT(broken(ConnectionFault::garbage), testing::Not(testing::StartsWith("HTTP")));
  const std::string corrupt = broken(ConnectionFault::corrupt);
  ASSERT_EQ(corrupt.size(), usual.size());
  std::size_t differing = 0;
  for (std::size_t i = 0; i < usual.size(); ++i) differing += usual[i] != corrupt[i] ? 1U : 0U;
  EXPECT_EQ(differing, 1U);
}

TEST_F(CollectorFaultsTest, StaysSilentUntilItEnds) {
  collector->setFault("/events", ConnectionFault::silent);
  auto waiting = std::async(std::launch::async, [this] { return static_cast<bool>(post("/events", kPost)); });
  ASSERT_TRUE(collector->waitForRequests(1, kTimeout));
  EXPECT_EQ(http().Get("/requests")->status, 200) << "others are served meanwhile";
  collector->stop();
  EXPECT_FALSE(waiting.get());
}

TEST_F(CollectorFaultsTest, DelaysAndRedirectsAsAsked) {
  const std::string settings = R"({"path":"/old","status":307,"delayMs":300,"headers":{"Location":"/new"},"body":"x"})";
  ASSERT_EQ(control("/control/paths", settings), 200);
  const auto before = std::chrono::steady_clock::now();
  auto delayed = std::async(std::launch::async, [this] { return post("/old", kPost); });
  ASSERT_TRUE(collector->waitForRequests(1, kTimeout));
  EXPECT_EQ(post("/elsewhere", kPost)->status, 200) << "others go ahead";
  const auto answer = delayed.get();
  EXPECT_GE(std::chrono::steady_clock::now() - before, std::chrono::milliseconds(300));
  EXPECT_EQ(answer->status, 307);
  EXPECT_EQ(answer->get_header_value("Location"), "/new");
  EXPECT_EQ(answer->body, "x");
}

TEST_F(CollectorFaultsTest, RefusesSettingsThatItDoesNotKnow) {
  const std::vector<std::pair<std::string, std::vector<const char*>>> table{
      {"/control/paths",
       {"{", "[]", R"({"status":503})", R"({"path":"/events","statu":503})", R"({"path":"/events","status":99})",
        R"({"path":"/events","fault":"meteor"})", R"({"path":"/events","times":0})",
        R"({"path":"/events","headers":{"A":"b\r\nC: d"}})"}},
      {"/control/acknowledgements", {R"({"lossPercent":101})", R"({"loss":10})", R"({"acknowledge":1})"}},
      {"/control/storebag", {R"({"container":"json"})", R"({"maxAge":"60"})"}},
  };
  for (const auto& [path, settings] : table) {
    for (const char* json : settings) {
      const auto answer = post(path, json);
      EXPECT_EQ(answer->status, 400) << path << " " << json;
      EXPECT_THAT(answer->body, testing::HasSubstr("\"error\"")) << json;
    }
  }
  EXPECT_EQ(post("/control/unknown", "{}")->status, 404);
  EXPECT_EQ(http().Put("/control/bag", "[1]", "application/json")->status, 400);
  EXPECT_EQ(at(list("/control"), "paths"), Dictionary{});
  EXPECT_TRUE(collector->requests().empty()) << "settings are not recorded";
}

TEST_F(CollectorFaultsTest, ShowsAndClearsSettings) {
  ASSERT_EQ(control("/control/paths", R"({"path":"/events","status":503,"times":3,"delayMs":5,"fault":"corrupt"})"),
            200);
  ASSERT_EQ(control("/control/acknowledgements", R"({"lossPercent":30,"duplicates":2})"), 200);
  ASSERT_EQ(control("/control/storebag", R"({"container":"binary","maxAge":null})"), 200);
  const auto state = list("/control");
  EXPECT_EQ(at(at(state, "paths"), "/events"),
            (Dictionary{{"status", 503}, {"times", 3}, {"delayMs", 5}, {"fault", "corrupt"}}));
  EXPECT_EQ(at(at(state, "acknowledgements"), "lossPercent"), 30);
  EXPECT_EQ(at(at(state, "storebag"), "container"), "binary");
  EXPECT_TRUE(at(at(state, "storebag"), "maxAge").isNull());
  EXPECT_EQ(http().Delete("/control/paths?path=/other")->status, 404);
  EXPECT_EQ(http().Delete("/control/paths?path=/events")->status, 200);
  EXPECT_EQ(at(list("/control"), "paths"), Dictionary{});
}

}  // namespace
}  // namespace orvanta::collector
