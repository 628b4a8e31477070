#include "util/MessageLog.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <set>
#include <thread>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"
#include "util/MessageLogDirectory.h"

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
    std::ifstream file(directory + "/" + name);
    return {std::istreambuf_iterator<char>(file), {}};
  }
  std::string nameForNow() const {
    return "orvantad_" + std::to_string(static_cast<int>(platform.clock.wallSeconds())) + "_messageLog.diag";
  }
  std::string prefix() const { return "(" + platform::describeDate(platform.clock.wallSeconds()) + ") "; }

  test::TestPlatform platform;
  const std::string directory;
};

TEST(MessageLogName, hasThreePieces) {
  struct Row {
    std::string_view name;
    bool expected;
  };
  const Row rows[] = {
      {"orvantad_1795619045_messageLog.diag", true},
      {"orvantad_-5_messageLog.diag", true},
      {"orvantad_any text_messageLog.diag", true},
      {"orvantad__messageLog.diag", true},
      {"orvantad_1795619045_1_messageLog.diag", false},
      {"orvantad_messageLog.diag", false},
      {"orvantad", false},
      {"", false},
      {"_", false},
      {"__", false},
      {"Orvantad_1_messageLog.diag", false},
      {"orvantad_1_messagelog.diag", false},
      {"orvantad_1_messageLog.diag.gz", false},
      {"xorvantad_1_messageLog.diag", false},
      {"orvantad_1_messageLog.diag_", false},
      {"_orvantad_1_messageLog.diag", false},
  };
  for (const Row& row : rows) EXPECT_EQ(isMessageLogName(row.name), row.expected) << row.name;
  EXPECT_EQ(messageLogName(1795619045), "orvantad_1795619045_messageLog.diag");
  EXPECT_TRUE(isMessageLogName(messageLogName(-1)));
}

TEST_F(MessageLogTest, theFirstLineMakesTheDirectoryAndTheFile) {
  fs::remove_all(platform.get().files().stateDirectory + "/Logs");
  platform.clock.set(1795532645.75);
  const std::string path = directory + "/orvantad_1795532645_messageLog.diag";
  const test::LogCapture log;
  writeToLogFile(platform, "[http_post -> flushMessages] done");
  EXPECT_THAT(log.lines(), ElementsAre("<6>writeToLogFile: Creating orvantad log directory at " + directory,
                                       "<6>writeToLogFile: Created new orvantad log file " + path + " (" +
                                           platform::describeDate(birthTime(path)) + ")",
                                       "<6>writeToLogFile: Saved log message to " + path));
  EXPECT_EQ(content("orvantad_1795532645_messageLog.diag"),
            "(2026-11-24 15:04:05 +0000) [http_post -> flushMessages] done\n");
}

TEST_F(MessageLogTest, laterLinesAreAppendedAsTheyAre) {
  const std::string name = nameForNow();
  const std::string first = prefix();
  writeToLogFile(platform, "one");
  platform.clock.advance(60);
  const test::LogCapture log;
  writeToLogFile(platform, "two\nlines\n");
  writeToLogFile(platform, "");
  EXPECT_EQ(content(name), first + "one\n" + prefix() + "two\nlines\n\n" + prefix() + "\n");
  EXPECT_THAT(log.lines(), ElementsAre("<6>writeToLogFile: Saved log message to " + directory + "/" + name,
                                       "<6>writeToLogFile: Saved log message to " + directory + "/" + name));
}

TEST_F(MessageLogTest, aFileIsReplacedOnceItIsMoreThanADayOld) {
  struct Row {
    double age;
    bool replaced;
  };
  for (const Row& row :
       {Row{-5, false}, Row{0, false}, Row{86399, false}, Row{86400, false}, Row{86401, true}, Row{1e6, true}}) {
    const std::string old = make("orvantad_1_messageLog.diag", "old\n");
    const double birth = birthTime(old);
    platform.clock.set(birth + row.age);
    const test::LogCapture log;
    writeToLogFile(platform, "new");
    const std::string line = prefix() + "new\n";
    if (row.replaced) {
      EXPECT_THAT(names(), ElementsAre(nameForNow())) << row.age;
      EXPECT_EQ(content(nameForNow()), line);
      EXPECT_TRUE(log.contains("<6>writeToLogFile: Deleted expired orvantad log file " + old + " (" +
                               platform::describeDate(birth) + ")"));
      fs::remove(directory + "/" + nameForNow());
    } else {
      EXPECT_THAT(names(), ElementsAre("orvantad_1_messageLog.diag")) << row.age;
      EXPECT_EQ(content("orvantad_1_messageLog.diag"), "old\n" + line);
    }
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
  EXPECT_EQ(content("orvantad_1_2_messageLog.diag"), "untouched");
  EXPECT_EQ(content("other.diag"), "untouched");
  EXPECT_EQ(content("orvantad_3_messageLog.diag"), "untouched");
}

TEST_F(MessageLogTest, withoutADirectoryTheLineIsLost) {
  fs::remove(directory);
  std::ofstream(directory) << "a file in its place";
  const test::LogCapture log;
  writeToLogFile(platform, "line");
  EXPECT_THAT(log.lines(), ElementsAre("<3>writeToLogFile: Error reading from log directory: Not a directory",
                                       "<3>writeToLogFile: Failed to create new orvantad log file " + directory + "/" +
                                           nameForNow()));
}

TEST_F(MessageLogTest, aNewFileNeverReplacesWhatBearsItsName) {
  fs::create_symlink(platform.directory / "outside", directory + "/" + nameForNow());
  const test::LogCapture log;
  writeToLogFile(platform, "line");
  EXPECT_FALSE(fs::exists(platform.directory / "outside"));
  EXPECT_THAT(log.lines(), ElementsAre("<3>writeToLogFile: Failed to create new orvantad log file " + directory + "/" +
                                       nameForNow()));
}

// Files of this process end at a number of bytes while it lives.
class FileSizeLimit {
 public:
  explicit FileSizeLimit(rlim_t bytes) : _handler(::signal(SIGXFSZ, SIG_IGN)) {
    ::getrlimit(RLIMIT_FSIZE, &_before);
    const rlimit lowered{bytes, _before.rlim_max};
    ::setrlimit(RLIMIT_FSIZE, &lowered);
  }
  ~FileSizeLimit() {
    ::setrlimit(RLIMIT_FSIZE, &_before);
    ::signal(SIGXFSZ, _handler);
  }

 private:
  rlimit _before{};
  void (*_handler)(int);
};

TEST_F(MessageLogTest, aLineThatDoesNotFitOnTheDiskExpiresTheFile) {
  for (const rlim_t room : {rlim_t{0}, rlim_t{7}}) {  // nothing or a part of the line can be written
    const std::string path = make("orvantad_1_messageLog.diag", "earlier\n");
    const test::LogCapture log;
    {
      const FileSizeLimit limit(8 + room);
      writeToLogFile(platform, "line");
    }
    EXPECT_THAT(names(), IsEmpty());
    EXPECT_EQ(log.count("<6>writeToLogFile: Deleted expired orvantad log file " + path), 1);
    EXPECT_FALSE(log.contains("Saved log message"));
  }
}

TEST_F(MessageLogTest, linesOfSeveralThreadsDoNotMix) {
  writeToLogFile(platform, "start");
  constexpr int kThreads = 4;
  constexpr int kLines = 100;
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([this, thread] {
      for (int line = 0; line < kLines; ++line) {
        writeToLogFile(platform, std::to_string(thread) + "." + std::to_string(line) + std::string(3000, '.'));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  ASSERT_THAT(names(), ElementsAre(nameForNow()));
  std::ifstream file(directory + "/" + nameForNow());
  std::string line;
  std::set<std::string> lines;
  while (std::getline(file, line)) lines.insert(line);
  std::set<std::string> expected = {prefix() + "start"};
  for (int thread = 0; thread < kThreads; ++thread) {
    for (int number = 0; number < kLines; ++number) {
      expected.insert(prefix() + std::to_string(thread) + "." + std::to_string(number) + std::string(3000, '.'));
    }
  }
  EXPECT_EQ(lines, expected);
}

}  // namespace
}  // namespace orvanta
