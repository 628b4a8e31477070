#include "platform/host/JsonLinesPowerLog.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <set>
#include <vector>

#include "platform/codec/Json.h"
#include "platform/host/LibraryPowerLog.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/TestClock.h"
#include "tests/support/Threads.h"

namespace orvanta::platform {
namespace {

using testing::ElementsAre;

class JsonLinesPowerLogTest : public testing::Test {
 protected:
  std::vector<std::string> lines(const std::string& name = "powerlog.jsonl") const {
    std::ifstream file(directory / name);
    std::vector<std::string> found;
    for (std::string line; std::getline(file, line);) found.push_back(line);
    return found;
  }

  orvanta::test::TemporaryDirectory directory;
  orvanta::test::TestClock clock{1795532645.5};
  const std::string path = directory / "powerlog.jsonl";
};

TEST_F(JsonLinesPowerLogTest, writesOneLineOfJsonPerRecord) {
  JsonLinesPowerLog log(path, clock);
  const Dictionary record{{"x", 1}, {"text \"in quotes\"", "two\nlines"}, {"list", Array{true, Value()}}};
  log.registeredEvent(28, "Vesperd-ORV", record);
  log.registeredEvent(-1, "", {});
  EXPECT_THAT(lines(), ElementsAre(R"({"event":28,"sender":"Vesperd-ORV","time":1795532645.5,"record":)"
                                   R"({"list":[true,null],"text \"in quotes\"":"two\nlines","x":1}})",
                                   R"({"event":-1,"sender":"","time":1795532645.5,"record":{}})"));
}

TEST_F(JsonLinesPowerLogTest, keepsTwoGenerations) {
  const Dictionary record{{"filler", std::string(400, 'f')}};  // two lines fit, three do not
  const auto eventsAfter = [&](int first, int last) {
    JsonLinesPowerLog log(path, clock, 1000);  // each goes on where the one before stopped
    for (int event = first; event <= last; ++event) log.registeredEvent(event, "s", record);
    std::string events;
    for (const char* name : {"powerlog.jsonl.1", "powerlog.jsonl"}) {
      for (const auto& line : lines(name)) events += line.substr(9, 1);  // {"event":N
      events += ' ';
    }
    return events;
  };
  EXPECT_EQ(eventsAfter(1, 2), " 12 ");
  EXPECT_EQ(eventsAfter(3, 5), "34 5 ");
  EXPECT_EQ(eventsAfter(6, 7), "56 7 ");
  // The file is taken away while it is written: the next record makes a new one.
  JsonLinesPowerLog log(path, clock, 1000);
  log.registeredEvent(8, "s", {});
  std::filesystem::rename(path, directory / "moved");
  log.registeredEvent(9, "s", {{"more than a generation holds", std::string(1000, 'f')}});
  log.registeredEvent(9, "s", {});
  EXPECT_EQ(lines("moved").size(), 2U);
  EXPECT_EQ(lines().size(), 1U);
}

TEST_F(JsonLinesPowerLogTest, saysOnceThatRecordsAreLost) {
  std::filesystem::create_directory(path);
  orvanta::test::LogCapture captured;
  JsonLinesPowerLog log(path, clock);
  for (int round = 0; round < 3; ++round) log.registeredEvent(1, "s", {});
  EXPECT_THAT(captured.lines(), ElementsAre("<4>registeredEvent: cannot write to " + path + ": Is a directory"));
  std::filesystem::remove(path);
  log.registeredEvent(2, "s", {});
  EXPECT_EQ(lines().size(), 1);
  // Nor does a FIFO, with a reader or without, hold up those who write.
  std::filesystem::remove(path);
  ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);
  log.registeredEvent(3, "s", {});
  const UniqueFd reader(::open(path.c_str(), O_RDONLY | O_NONBLOCK));
  captured.clear();
  JsonLinesPowerLog(path, clock).registeredEvent(3, "s", {});
  EXPECT_THAT(captured.lines(), ElementsAre("<4>registeredEvent: cannot write to " + path + ": Invalid argument"));
}

TEST_F(JsonLinesPowerLogTest, followsNoLink) {
  std::filesystem::create_symlink(directory / "elsewhere", path);
  JsonLinesPowerLog log(path, clock);
  log.registeredEvent(1, "s", {});
  EXPECT_FALSE(std::filesystem::exists(directory / "elsewhere"));
}

TEST_F(JsonLinesPowerLogTest, recordsOfSeveralThreadsStayWhole) {
  JsonLinesPowerLog log(path, clock, 16U << 20U);
  orvanta::test::inThreads(4, [&log](int thread) {
    for (int record = 0; record < 100; ++record) {
      log.registeredEvent(thread * 100 + record, "s", {{"filler", std::string(500, 'f')}});
    }
  });
  std::set<std::int64_t> events;
  for (const std::string& line : lines()) {
    const auto parsed = parseJson(line);
    ASSERT_TRUE(parsed) << line;
    events.insert(parsed->dictionary()->find("event")->integerValue());
  }
  EXPECT_EQ(events.size(), 400);
}

TEST(LibraryPowerLog, isNoneWhereTheLibraryIsMissingOrLacksTheFunction) {
  const orvanta::test::LogCapture captured;
  EXPECT_FALSE(LibraryPowerLog::load("libnowhere.so.1"));
  EXPECT_FALSE(LibraryPowerLog::load("libm.so.6"));
  EXPECT_THAT(
      captured.lines(),
      ElementsAre(testing::StartsWith("<6>PowerLog(load): No platform power log, records go to a file: libnowh"),
                  testing::AllOf(testing::StartsWith("<4>PowerLog(load): libm.so.6 is of no use"),
                                 testing::HasSubstr("undefined symbol: VMLogRegisteredEvent"))));
}

}  // namespace
}  // namespace orvanta::platform
