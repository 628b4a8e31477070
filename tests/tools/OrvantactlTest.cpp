// The parts of orvantactl that need no daemon, and its pipeline against one that the test plays.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

#include "tests/client/ClientFixture.h"
#include "tests/support/TemporaryDirectory.h"
#include "tools/orvantactl/AnswerLines.h"
#include "tools/orvantactl/EventLine.h"
#include "tools/orvantactl/EventPipeline.h"
#include "tools/orvantactl/JsonValues.h"
#include "tools/orvantactl/LineReader.h"

namespace orvanta::ctl {
using platform::Data;
using platform::Date;

namespace {

TEST(EventLine, takesEventsAsTheyAreWritten) {
  const struct {
    const char* line;
    EventDefaults defaults;
    Dictionary parameters;
  } rows[] = {
      {R"({"category":1,"type":2})", {}, {{"category", 1}, {"type", 2}}},
      {R"({"category":1,"type":2,"payload":{"a":[1,{"b":"x"}]}})",
       {},
       {{"category", 1}, {"type", 2}, {"payload", Dictionary{{"a", Array{1, Dictionary{{"b", "x"}}}}}}}},
      {R"({"category":1,"type":2,"realtime":true,"promote":true})", {}, {{"category", 1}, {"type", 2}, {"flag", 3}}},
      {R"({"category":1,"type":2})", {true, false}, {{"category", 1}, {"type", 2}, {"flag", 1}}},
      {R"({"category":1,"type":2,"realtime":false})", {true, true}, {{"category", 1}, {"type", 2}, {"flag", 2}}},
      {R"({"category":1,"type":2,"payload":{"at":{"$date":5.5},"raw":{"$data":"AAE="}}})",
       {},
       {{"category", 1}, {"type", 2}, {"payload", Dictionary{{"at", Date{5.5}}, {"raw", Data{{0, 1}}}}}}},
  };
  for (const auto& row : rows) {
    const auto event = parseEventLine(row.line, row.defaults);
    ASSERT_TRUE(event) << row.line << ": " << event.error();
    EXPECT_EQ(*event->dictionary(), row.parameters) << row.line;
  }
}

TEST(EventLine, saysWhatIsWrong) {
  const std::pair<const char*, std::vector<const char*>> rows[] = {
      {"", {"", "{", R"({"category":1,"type":2} x)"}},
      {"object", {"[1,2]"}},
      {"\"category\" is missing", {R"({"type":2})"}},
      {"\"type\" is missing", {R"({"category":1})"}},
      {"\"category\" must be",
       {R"({"category":65536,"type":2})", R"({"category":-1,"type":2})", R"({"category":1.5,"type":2})",
        R"({"category":"1","type":2})", R"({"category":true,"type":2})"}},
      {"\"type\" must be", {R"({"category":1,"type":null})"}},
      {"\"payload\" must be an object",
       {R"({"category":1,"type":2,"payload":[]})", R"({"category":1,"type":2,"payload":{"$date":1}})"}},
      {"\"flag\" must be", {R"({"category":1,"type":2,"flag":4294967296})"}},
      {"\"realtime\" must be true or false", {R"({"category":1,"type":2,"realtime":1})"}},
      {"\"realtme\" is not a key", {R"({"category":1,"type":2,"realtme":true})"}},
      {"$date", {R"({"category":1,"type":2,"payload":{"a":{"$date":"x"}}})"}},
      {"alone", {R"({"category":1,"type":2,"payload":{"a":{"$date":1,"b":2}}})"}},
      {"$data", {R"({"category":1,"type":2,"payload":{"a":[{"$data":"A"}]}})"}},
  };
  for (const auto& [problem, lines] : rows) {
    for (const char* line : lines) {
      const auto event = parseEventLine(line, {});
      ASSERT_FALSE(event) << line;
      EXPECT_NE(event.error().find(problem), std::string::npos) << line << ": " << event.error();
      EXPECT_FALSE(event.error().empty()) << line;
    }
  }
}

std::vector<std::string> linesOf(const std::string& content) {
  const test::TemporaryDirectory directory;
  const platform::UniqueFd file(::open(directory.write("lines", content).c_str(), O_RDONLY));
  LineReader reader(file.get());
  std::vector<std::string> lines;
  std::string_view line;
  for (;;) {
    const auto outcome = reader.next(line);
    if (outcome == LineReader::Outcome::end) return lines;
    lines.push_back(outcome == LineReader::Outcome::line ? std::string(line)
                                                         : "too long: " + std::to_string(reader.lineNumber()));
  }
}

TEST(LineReader, givesEveryLineOnceAndSaysThatReadingFailed) {
  const std::string wide(200'000, 'w');
  const std::pair<std::string, std::vector<std::string>> rows[] = {
      {"", {}},
      {"a\nb", {"a", "b"}},
      {"a\r\n\nb\n", {"a", "", "b"}},
      {wide + "\nx\n" + wide, {wide, "x", wide}},
  };
  for (const auto& [content, lines] : rows) EXPECT_EQ(linesOf(content), lines) << content.substr(0, 20);
  const std::string giant(LineReader::kMaximumLine + 1, 'g');
  EXPECT_EQ(linesOf("a\n" + giant + "\nb"), (std::vector<std::string>{"a", "too long: 2", "b"}));
  EXPECT_EQ(linesOf(giant), (std::vector<std::string>{"too long: 1"}));
  LineReader unreadable(-1);
  std::string_view line;
  EXPECT_EQ(unreadable.next(line), LineReader::Outcome::failed);
  EXPECT_EQ(unreadable.error(), EBADF);
}

TEST(FlushVerdict, forgivesOnlyThatThereWasNothing) {
  const auto verdict = [](const char* description, int code) {
    return flushProblem({std::nullopt, OrvantaError{"d", code, description}}).has_value();
  };
  EXPECT_FALSE(flushProblem({"sent", std::nullopt}));
  EXPECT_FALSE(verdict("Nothing to flush", -1));
  EXPECT_FALSE(verdict("Nothing to flush: batched events were completely filtered out", -1));
  EXPECT_TRUE(verdict("Can not flush: userInfo is required", -1));
  EXPECT_TRUE(verdict("Service Unavailable", 503));
  EXPECT_EQ(flushLine({"a\"b", OrvantaError{"d", 503, "down"}}),
            R"({"flush":{"error":{"code":503,"description":"down"},"result":"a\"b"}})");
}

TEST(DefaultsValue, isReadAsItsType) {
  const struct {
    const char* text;
    const char* type;
    Value value;
  } rows[] = {
      {"5", "string", "5"},
      {"-5", "int", -5},
      {"2.5", "float", 2.5},
      {"yes", "bool", true},
      {"false", "bool", false},
      {"[1,{\"a\":2}]", "json", Array{1, Dictionary{{"a", 2}}}},
      {"{\"$date\":3}", "json", Date{3}},
  };
  for (const auto& row : rows) {
    const auto value = parseDefaultsValue(row.text, row.type);
    ASSERT_TRUE(value) << row.text;
    EXPECT_EQ(*value, row.value) << row.text;
  }
  const char* refused[][2] = {{"", "int"},      {"5x", "int"},    {"5.0", "int"},    {"99999999999999999999", "int"},
                              {"inf", "float"}, {"", "float"},    {"maybe", "bool"}, {"", "bool"},
                              {"{", "json"},    {"null", "json"}, {"5", "number"},   {"{\"a\":[1,null]}", "json"}};
  for (const auto& row : refused) EXPECT_FALSE(parseDefaultsValue(row[0], row[1])) << row[0] << " " << row[1];
  EXPECT_EQ(showDefaultsValue("plain text"), "plain text");
  EXPECT_EQ(showDefaultsValue(Array{1, true}), "[1,true]");
}

TEST(EventJson, tellsAllOfAnEvent) {
  AggregatedEvent event;
  event.sessionInfo = std::make_shared<const Dictionary>(Dictionary{{"sessionID", 5}});
  event.timestamp = 12.5;
  event.category = 3;
  EXPECT_EQ(aggregatedEventLine(event),
            R"({"timestamp":12.5,"category":3,"type":0,"payload":null,"session":{"sessionID":5}})");
  event.payload = std::make_shared<const Dictionary>(Dictionary{{"at", Date{1}}});
  EXPECT_NE(aggregatedEventLine(event).find(R"("payload":{"at":{"$date":1)"), std::string::npos);
  EXPECT_EQ(watchingLine("a\"b", 2), R"({"watching":{"level":2,"token":"a\"b"}})");
}

class Pipeline : public test::ClientFixture {
 protected:
  void TearDown() override { connection.reset(); }
};

TEST_F(Pipeline, writesAnswersInOrderAndCountsFailures) {
  char* written = nullptr;
  std::size_t size = 0;
  std::FILE* out = ::open_memstream(&written, &size);
  EventPipeline pipeline(session(), 4, out);  // its answers come in another order
  pipeline.send(1, {.category = 1});
  pipeline.send(2, {.category = 2});
  pipeline.send(4, {.category = 3});
  const auto one = peer->next(), two = peer->next(), three = peer->next();
  peer->answer(three, {"c"});
  peer->refuse(two, "no \"room\"");
  peer->answer(one, {nullptr});
  pipeline.drain();
  std::fclose(out);
  EXPECT_STREQ(
      written,
      "{\"event\":1,\"reply\":null}\n{\"event\":2,\"error\":\"no \\\"room\\\"\"}\n{\"event\":4,\"reply\":\"c\"}\n");
  std::free(written);
  EXPECT_EQ(pipeline.failures(), 1U);
  EXPECT_FALSE(pipeline.lost());
}

TEST_F(Pipeline, neverHasMoreUnderWayThanItsWindow) {
  constexpr int kEvents = 200, kWindow = 2;
  EventPipeline pipeline(session(), kWindow, nullptr);
  std::atomic<int> sent = 0;
  std::thread sender([&] {
    for (int i = 1; i <= kEvents; ++i) {
      pipeline.send(static_cast<std::uint64_t>(i), {.category = 7});
      ++sent;
    }
  });
  int mostUnderWay = 0;
  for (int answered = 0; answered < kEvents;) {
    const auto first = peer->next(), second = peer->next();
    std::this_thread::yield();  // a sender that does not wait runs ahead here
    mostUnderWay = std::max(mostUnderWay, sent - answered);
    peer->answer(second, {nullptr});
    peer->answer(first, {nullptr});
    answered += 2;
  }
  sender.join();
  pipeline.drain();
  EXPECT_LE(mostUnderWay, kWindow);
  EXPECT_EQ(pipeline.failures(), 0U);
}

TEST_F(Pipeline, tellsThatTheDaemonHasGone) {
  EventPipeline pipeline(session(), 2, nullptr);
  pipeline.send(1, {});
  peer->next();
  peer->close();
  pipeline.drain();
  EXPECT_TRUE(pipeline.lost());
  ASSERT_TRUE(pipeline.firstError());
  EXPECT_EQ(pipeline.firstError()->kind, CallErrorKind::notEntitled) << "before any answer";
  EXPECT_NE(pipeline.firstError()->text.find("com.kovalt.private.orvantad"), std::string::npos);
}

}  // namespace
}  // namespace orvanta::ctl
