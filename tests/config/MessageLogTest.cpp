#include "config/MessageLog.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <set>

#include "config/MessageLogDirectory.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"
#include "tests/support/Threads.h"

namespace orvanta {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

// Birth times are the file system's and cannot be set, so that it is the clock that moves.
double birthTime(const std::string& path) {
  struct statx status {};
  if (::statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BTIME, &status) != 0 ||
      (status.stx_mask & STATX_BTIME) == 0) {
    throw std::runtime_error("the file system keeps no birth time for " + path);
  }
  return static_cast<double>(status.stx_btime.tv_sec) + status.stx_btime.tv_nsec / 1e9;
}

class MessageLogTest : public testing::Test {
 protected:
  MessageLogTest() : directory(platform.get().files().stateDirectory + "/Logs/Faultline/Retired") {
    fs::create_directories(directory);
    platform.clock.set(birthTime(directory));
  }

  std::string make(const std::string& name, const std::string& content = "") const {
    std::ofstream(directory + "/" + name) << content;
    return directory + "/" + name;
  }
  // Made again until the file system's clock has moved on from the other file's birth.
  std::string makeLaterThan(const std::string& other, const std::string& name) const {
    std::string path;
    do {
      path = make(name);
      if (birthTime(path) > birthTime(other)) return path;
      fs::remove(path);
    } while (true);
  }
  std::vector<std::string> names() const {
    std::vector<std::string> found;
    for (const auto& entry : fs::directory_iterator(directory)) found.push_back(entry.path().filename());
    return found;
  }
  std::string content(const std::string& name) const {
    return platform.directory.read("state/Logs/Faultline/Retired/" + name);
  }
  std::string nameForNow() const {
    return "orvantad_" + std::to_string(static_cast<int>(platform.clock.wallSeconds())) + "_messageLog.diag";
  }
  std::string prefix() const { return "(" + platform::describeDate(platform.clock.wallSeconds()) + ") "; }

  test::TestPlatform platform;
  const std::string directory;
};

TEST(MessageLogName, hasThreePieces) {
  for (const char* name : {"orvantad_1795619045_messageLog.diag", "orvantad_any text_messageLog.diag"}) {
    EXPECT_TRUE(isMessageLogName(name)) << name;
  }
  for (const char* name : {"orvantad_1795619045_1_messageLog.diag", "orvantad_messageLog.diag", "",
                           "Orvantad_1_messageLog.diag", "orvantad_1_messageLog.diag.gz"}) {
    EXPECT_FALSE(isMessageLogName(name)) << name;
  }
  EXPECT_TRUE(isMessageLogName(messageLogName(-1)));
}

TEST_F(MessageLogTest, theFirstLineMakesTheDirectoryAndTheFileAndLaterOnesAreAppendedAsTheyAre) {
  fs::remove_all(platform.get().files().stateDirectory + "/Logs");
  platform.clock.set(1795532645.75);
  const std::string path = directory + "/orvantad_1795532645_messageLog.diag";
  const test::LogCapture log;
  writeToLogFile(platform, "[http_post -> flushMessages] done");
  platform.clock.advance(60);
  writeToLogFile(platform, "two\nlines\n");
  writeToLogFile(platform, "");
  const std::string saved = "<6>writeToLogFile: Saved log message to " + path;
  EXPECT_THAT(log.lines(), ElementsAre("<6>writeToLogFile: Creating orvantad log directory at " + directory,
                                       "<6>writeToLogFile: Created new orvantad log file " + path + " (" +
                                           platform::describeDate(birthTime(path)) + ")",
                                       saved, saved, saved));
  EXPECT_EQ(content("orvantad_1795532645_messageLog.diag"),
            "(2026-11-24 15:04:05 +0000) [http_post -> flushMessages] done\n"
            "(2026-11-24 15:05:05 +0000) two\nlines\n\n(2026-11-24 15:05:05 +0000) \n");
}

TEST_F(MessageLogTest, aFileIsReplacedOnceItIsMoreThanADayOld) {
  for (const double age : {-5.0, 0.0, 86399.0, 86400.0, 86401.0, 1e6}) {
    const std::string old = make("orvantad_1_messageLog.diag", "old\n");
    const double birth = birthTime(old);
    platform.clock.set(birth + age);
    const test::LogCapture log;
    writeToLogFile(platform, "new");
    const bool replaced = age > 86400;
    const std::string name = replaced ? nameForNow() : "orvantad_1_messageLog.diag";
    EXPECT_THAT(names(), ElementsAre(name)) << age;
    EXPECT_EQ(content(name), (replaced ? "" : "old\n") + prefix() + "new\n");
    EXPECT_EQ(log.contains("<6>writeToLogFile: Deleted expired orvantad log file " + old + " (" +
                           platform::describeDate(birth) + ")"),
              replaced);
    fs::remove(directory + "/" + name);
  }
}

TEST_F(MessageLogTest, ofSeveralTheNewestStays) {
  // The names are in the opposite order of the births, and the listing's order is the file system's.
  std::vector<std::string> paths = {make("orvantad_9_messageLog.diag")};
  for (int name = 8; name >= 5; --name) {
    paths.push_back(makeLaterThan(paths.back(), "orvantad_" + std::to_string(name) + "_messageLog.diag"));
  }
  platform.clock.set(birthTime(paths.back()) + 10);
  const test::LogCapture log;
  writeToLogFile(platform, "line");
  EXPECT_THAT(names(), ElementsAre("orvantad_5_messageLog.diag"));
  EXPECT_EQ(content("orvantad_5_messageLog.diag"), prefix() + "line\n");
  EXPECT_EQ(log.count("Deleted expired orvantad log file"), 4);
}

TEST_F(MessageLogTest, neverTouchesOtherFiles) {
  const std::string outside = platform.directory.write("outside", "untouched");
  make("orvantad_1_2_messageLog.diag", "untouched");
  make("other.diag", "untouched");
  fs::create_directory(directory + "/orvantad_2_messageLog.diag");
  fs::create_symlink(outside, directory + "/orvantad_3_messageLog.diag");
  platform.clock.advance(3 * 86400.0);
  writeToLogFile(platform, "line");
  EXPECT_THAT(names(), UnorderedElementsAre("orvantad_1_2_messageLog.diag", "other.diag", "orvantad_2_messageLog.diag",
                                            "orvantad_3_messageLog.diag", nameForNow()));
  for (const char* name : {"orvantad_1_2_messageLog.diag", "other.diag", "orvantad_3_messageLog.diag"}) {
    EXPECT_EQ(content(name), "untouched");
  }
}

TEST_F(MessageLogTest, whereNoFileCanBeMadeTheLineIsLost) {
  const std::string failed =
      "<3>writeToLogFile: Failed to create new orvantad log file " + directory + "/" + nameForNow();
  fs::create_symlink(platform.directory / "outside", directory + "/" + nameForNow());  // bears its name
  test::LogCapture log;
  writeToLogFile(platform, "line");
  EXPECT_FALSE(fs::exists(platform.directory / "outside"));
  EXPECT_THAT(log.lines(), ElementsAre(failed));
  log.clear();
  fs::remove_all(directory);
  std::ofstream(directory) << "a file in its place";
  writeToLogFile(platform, "line");
  EXPECT_THAT(log.lines(), ElementsAre("<3>writeToLogFile: Error reading from log directory: Not a directory", failed));
}

TEST_F(MessageLogTest, aLineThatDoesNotFitOnTheDiskExpiresTheFile) {
  rlimit before{};
  ASSERT_EQ(::getrlimit(RLIMIT_FSIZE, &before), 0);
  const auto handler = ::signal(SIGXFSZ, SIG_IGN);
  for (const rlim_t room : {0, 7}) {  // nothing or a part of the line can be written
    const std::string path = make("orvantad_1_messageLog.diag", "earlier\n");
    const rlimit lowered{8 + room, before.rlim_max};
    const test::LogCapture log;
    ::setrlimit(RLIMIT_FSIZE, &lowered);
    writeToLogFile(platform, "line");
    ::setrlimit(RLIMIT_FSIZE, &before);
    EXPECT_THAT(names(), IsEmpty());
    EXPECT_EQ(log.count("<6>writeToLogFile: Deleted expired orvantad log file " + path), 1);
    EXPECT_FALSE(log.contains("Saved log message"));
  }
  ::signal(SIGXFSZ, handler);
}

TEST_F(MessageLogTest, linesOfSeveralThreadsDoNotMix) {
  writeToLogFile(platform, "start");
  std::multiset<std::string> expected = {prefix() + "start"};
  const auto text = [](int thread) { return std::to_string(thread) + std::string(3000, '.'); };
  for (int line = 0; line < 400; ++line) expected.insert(prefix() + text(line % 4));
  test::inThreads(4, [&](int thread) {
    for (int line = 0; line < 100; ++line) writeToLogFile(platform, text(thread));
  });
  ASSERT_THAT(names(), ElementsAre(nameForNow()));
  std::ifstream file(directory + "/" + nameForNow());
  std::multiset<std::string> lines;
  for (std::string line; std::getline(file, line);) lines.insert(line);
  EXPECT_EQ(lines, expected);
}

}  // namespace
}  // namespace orvanta
