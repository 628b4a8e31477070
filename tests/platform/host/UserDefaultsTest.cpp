#include "platform/host/UserDefaults.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <csignal>
#include <filesystem>
#include <vector>

#include "platform/codec/PropertyList.h"
#include "tests/platform/Waiting.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/Threads.h"

namespace orvanta::platform {
namespace {

using orvanta::test::LogCapture;
using orvanta::test::TemporaryDirectory;
namespace fs = std::filesystem;

const char* const kDomain = "com.example.test";
const char* const kFile = "com.example.test.plist";

class UserDefaultsTest : public testing::Test {
 protected:
  std::string content() const { return _directory.read(kFile); }

  TemporaryDirectory _directory;
  UserDefaults _defaults{_directory.path(), kDomain};
  LogCapture _log;
};

TEST_F(UserDefaultsTest, AnotherReadsWhatWasSetAndEachSettingSaysWhetherTheFileHadToChange) {
  EXPECT_FALSE(*_defaults.set("text", nullptr));
  EXPECT_FALSE(fs::exists(_defaults.path()));
  EXPECT_TRUE(*_defaults.set("text", "hello"));
  EXPECT_FALSE(*_defaults.set("text", "hello"));
  EXPECT_TRUE(*_defaults.set("text", "other"));
  EXPECT_TRUE(*_defaults.set("number", 42));
  EXPECT_TRUE(*_defaults.set("flag", true));
  EXPECT_TRUE(*_defaults.set("flag", nullptr));
  UserDefaults other(_directory.path(), kDomain);
  EXPECT_EQ(other.text("number"), "42");
  EXPECT_EQ(other.text("text"), "other");
  EXPECT_EQ(other.text("flag"), std::nullopt);
  EXPECT_EQ(other.all().size(), 2U);
  EXPECT_TRUE(_log.lines().empty());
}

// Same size, same second, and possibly the same inode again: none of it may hide a change.
TEST_F(UserDefaultsTest, NoticesEveryChangeByOthers) {
  for (int i = 0; i < 200; ++i) {
    const std::string value = std::to_string(100 + i);
    const std::string content = "<plist><dict><key>key</key><string>" + value + "</string></dict></plist>";
    i % 2 == 0 ? _directory.replace(kFile, content) : _directory.write(kFile, content);
    ASSERT_EQ(_defaults.text("key"), value);
  }
  fs::remove(_defaults.path());
  EXPECT_EQ(_defaults.text("key"), std::nullopt);
}

TEST_F(UserDefaultsTest, KeepsCorruptFilesAside) {
  for (const std::string bad : {"<plist><dict><key>a</key>", "", "bplist00\xff", "<plist><array/></plist>"}) {
    _directory.replace(kFile, bad);
    _log.clear();
    for (int i = 0; i < 2; ++i) EXPECT_EQ(_defaults.value("a"), std::nullopt);
    EXPECT_EQ(_log.count("<3>UserDefaults: " + _defaults.path() + " is no property list, kept aside as"), 1U) << bad;
    EXPECT_EQ(_directory.read(std::string(kFile) + ".corrupt"), bad);
    EXPECT_FALSE(fs::exists(_defaults.path()));
    ASSERT_TRUE(_defaults.set("a", "new"));
    EXPECT_EQ(_defaults.text("a"), "new");
  }
}

TEST_F(UserDefaultsTest, NeverWritesOverWhatItCannotRead) {
  fs::create_directory(_defaults.path());  // stands in for a file without permission, which root would be able to read
  for (int i = 0; i < 2; ++i) EXPECT_EQ(_defaults.value("key"), std::nullopt);
  EXPECT_EQ(_log.count("not a regular file"), 1U);
  const auto result = _defaults.set("key", 1);
  ASSERT_FALSE(result);
  EXPECT_NE(result.error().find(_defaults.path()), std::string::npos) << result.error();
  EXPECT_TRUE(fs::is_directory(_defaults.path()));
  EXPECT_EQ(_defaults.valueOrStore("key", [] { return Value("fresh"); }), Value("fresh"));
  EXPECT_TRUE(_log.contains("<3>UserDefaults: the new value of key is not kept"));
}

TEST_F(UserDefaultsTest, AFailedWriteLeavesTheFileAsItWas) {
  ASSERT_TRUE(_defaults.set("key", "value"));
  const std::string before = content();
  EXPECT_FALSE(_defaults.set("bad", Array{Value()})) << "a null inside has no XML form";
  fs::create_directories(_defaults.path() + ".new/occupied");
  EXPECT_FALSE(_defaults.set("key", "other"));
  fs::remove_all(_defaults.path() + ".new");
  EXPECT_EQ(content(), before);
  EXPECT_EQ(_defaults.text("key"), "value");
}

TEST_F(UserDefaultsTest, WorksThroughASymbolicLinkAndMakesItsDirectory) {
  const std::string real = _directory / "private/state";
  fs::create_directories(real);
  fs::create_symlink("private/state", _directory / "link");
  UserDefaults linked(_directory / "link", kDomain);
  ASSERT_TRUE(linked.set("key", "value"));
  EXPECT_TRUE(fs::is_symlink(_directory / "link"));
  EXPECT_EQ(UserDefaults(real, kDomain).text("key"), "value");
  UserDefaults fresh(_directory / "not/yet/there", kDomain);
  ASSERT_TRUE(fresh.set("key", 1));
  EXPECT_EQ(fresh.text("key"), "1");
}

TEST_F(UserDefaultsTest, KeepsTheModeOfAFileAndMakesNewOnesPrivate) {
  ASSERT_TRUE(_defaults.set("key", 1));
  EXPECT_EQ(fs::status(_defaults.path()).permissions(), fs::perms{0600});
  fs::permissions(_defaults.path(), fs::perms{0640});
  ASSERT_TRUE(_defaults.set("key", 2));
  EXPECT_EQ(fs::status(_defaults.path()).permissions(), fs::perms{0640});
}

// Runs `body` in `count` child processes; true when all ended with status 0.
template <class Body>
bool inProcesses(int count, Body body) {
  std::vector<pid_t> children;
  for (int i = 0; i < count; ++i) {
    const pid_t child = ::fork();
    if (child == 0) ::_exit(body(i) ? 0 : 1);
    children.push_back(child);
  }
  bool ok = true;
  for (const pid_t child : children) {
    int status = 0;
    ok = ::waitpid(child, &status, 0) == child && WIFEXITED(status) && WEXITSTATUS(status) == 0 && ok;
  }
  return ok;
}

TEST_F(UserDefaultsTest, ProcessesAndThreadsLoseNothingAndAgreeOnWhatIsStoredOnce) {
  constexpr int kProcesses = 4, kRounds = 25;
  ASSERT_TRUE(inProcesses(kProcesses, [&](int process) {
    UserDefaults defaults(_directory.path(), kDomain);
    std::atomic<int> right{0};
    orvanta::test::inThreads(2, [&](int thread) {
      const std::string mine = std::to_string(process * 2 + thread);
      for (int round = 0; round < kRounds; ++round) {
        const std::string once = "once " + std::to_string(round);
        const Value stored = defaults.valueOrStore(once, [&] { return Value(mine); });
        const bool kept = defaults.set(mine + "/" + std::to_string(round), round).ok();
        right += kept && UserDefaults(_directory.path(), kDomain).value(once) == stored ? 1 : 0;
      }
    });
    return right == 2 * kRounds;
  }));
  EXPECT_EQ(_defaults.all().size(), std::size_t{(2 * kProcesses + 1) * kRounds});
}

// A writer killed at any moment leaves a whole file, and no lock or temporary file that stops the next writer.
TEST_F(UserDefaultsTest, AKilledWriterLeavesAWholeFile) {
  ASSERT_TRUE(_defaults.set("padding", std::string(20000, 'x')));
  ASSERT_TRUE(_defaults.set("count", 0));
  std::int64_t last = 0;
  for (int round = 0; round < 40; ++round) {
    const pid_t child = ::fork();
    if (child == 0) {
      UserDefaults defaults(_directory.path(), kDomain);
      for (std::int64_t i = last + 1; defaults.set("count", i); ++i) continue;
      ::_exit(1);
    }
    // A few writes, then the axe: where it falls differs from round to round.
    orvanta::test::eventually([&] { return _defaults.value("count")->integerValue() > last + round % 7; });
    ::kill(child, SIGKILL);
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_TRUE(WIFSIGNALED(status));
    const auto content = readPropertyListFile(_defaults.path());
    ASSERT_TRUE(content) << content.error();
    const auto count = _defaults.value("count");
    ASSERT_TRUE(count);
    EXPECT_GT(count->integerValue(), last);
    last = count->integerValue();
    EXPECT_EQ(_defaults.text("padding")->size(), 20000U);
  }
  EXPECT_TRUE(_log.lines().empty());
}

}  // namespace
}  // namespace orvanta::platform
