#include "platform/sandbox/Sandbox.h"

#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <netdb.h>
#include <pwd.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <ctime>
#include <filesystem>
#include <functional>

#include "platform/codec/PropertyList.h"
#include "platform/sandbox/Landlock.h"
#include "tests/support/ForbiddenActs.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::platform {
namespace {

namespace fs = std::filesystem;
using namespace orvanta::test;

constexpr const char* kProfile = "com.kovalt.test";
constexpr const char* kFile = "profiles/com.kovalt.test.plist";

// Runs in a child process of one thread, which ends without exit handlers: what is entered cannot be left again, and
// leak checks do not work inside. Gives back the text that `body` returns, or the signal that ended the child.
std::string inChild(const std::function<std::string()>& body) {
  int ends[2];
  if (::pipe(ends) != 0) return "pipe failed";
  UniqueFd read(ends[0]);
  UniqueFd write(ends[1]);
  const pid_t child = ::fork();
  if (child == 0) {
    const std::string text = body();
    const bool told = ::write(write.get(), text.data(), text.size()) == static_cast<ssize_t>(text.size());
    ::_exit(told ? 0 : 1);
  }
  write.reset();
  std::string text;
  char buffer[4096];
  for (ssize_t count = 0; (count = ::read(read.get(), buffer, sizeof buffer)) > 0;) {
    text.append(buffer, static_cast<std::size_t>(count));
  }
  int status = 0;
  ::waitpid(child, &status, 0);
  if (WIFSIGNALED(status)) return ::strsignal(WTERMSIG(status));
  return WEXITSTATUS(status) == 0 ? text : "the child failed";
}

std::string listing(const std::string& path) {
  DIR* directory = ::opendir(path.c_str());
  const std::string result = outcome(directory != nullptr);
  if (directory != nullptr) ::closedir(directory);
  return result;
}

Dictionary shippedProfile() {
  const auto document =
      readPropertyListFile(ORVANTA_SOURCE_DIR "/packaging/share/orvanta/sandbox/com.kovalt.orvantad.plist");
  return document ? *document->dictionary() : Dictionary();
}

// So many system calls that only the file rules are felt.
Dictionary generousCalls() {
  Array allow{"clone", "fork", "mknod", "mknodat", "rmdir", "symlink", "symlinkat", "truncate", "vfork", "wait4"};
  const Dictionary profile = shippedProfile();
  const Value* const calls = profile.find("calls");
  for (const auto& [key, list] : *calls->dictionary()) {
    for (const Value& item : *list.array()) {
      const Value* const call = key == "allowWith" ? item.dictionary()->find("call") : &item;
      if (std::find(allow.begin(), allow.end(), *call) == allow.end()) allow.push_back(*call);
    }
  }
  return {{"allow", allow}};
}

class SandboxTest : public testing::Test {
 protected:
  void SetUp() override {
    if (const auto landlock = Landlock::create(); !landlock) GTEST_SKIP() << landlock.error();
    for (const char* name : {"open", "readable", "closed"}) fillDirectory(name);
  }
  void fillDirectory(const std::string& name) const {
    directory.write(name + "/file", "content");
    fs::create_directory(directory / (name + "/empty"));
  }

  void writeProfile(const Array& files) {
    const auto text = writeXmlPropertyList(Dictionary{{"version", 1}, {"files", files}, {"calls", generousCalls()}});
    ASSERT_TRUE(text) << text.error();
    directory.write(kFile, *text);
  }
  // "open" may be used in every way but for running programs; "readable" is for reading; all else is closed.
  void writeUsualProfile() {
    writeProfile(
        {Dictionary{{"paths", Array{"${OPEN}"}}, {"access", Array{"read", "write", "create", "remove", "socket"}}},
         Dictionary{{"paths", Array{directory / "readable", "${ABSENT}", "/no/such/directory"}},
                    {"access", Array{"read"}},
                    {"optional", true}}});
  }
  Result<std::unique_ptr<Sandbox>> enter() const {
    return Sandbox::enter(directory / "profiles", kProfile, {{"OPEN", directory / "open"}, {"ABSENT", ""}});
  }
  std::string entered(const std::function<std::string()>& body) const {
    return inChild([&] {
      const auto result = enter();
      return result ? body() : result.error();
    });
  }

  TemporaryDirectory directory;
};

TEST_F(SandboxTest, allowsWhatTheProfileSaysAndNothingElse) {
  writeUsualProfile();
  using Operation = std::function<std::string(const std::string&)>;
  const auto run = [](const std::string&) { return ::execl("/bin/true", "/bin/true", nullptr), outcome(false); };
  const struct {
    const char* what;
    Operation operation;
    bool inOpen, inReadable;
  } rows[] = {
      {"read", [](auto& at) { return opening(at + "file", O_RDONLY); }, true, true},
      {"list", [](auto& at) { return listing(at); }, true, true},
      {"write", [](auto& at) { return opening(at + "file", O_WRONLY); }, true, false},
      {"append", [](auto& at) { return opening(at + "file", O_WRONLY | O_APPEND); }, true, false},
      {"empty", [](auto& at) { return outcome(::truncate((at + "file").c_str(), 0) == 0); }, true, false},
      {"create", [](auto& at) { return opening(at + "new", O_WRONLY | O_CREAT); }, true, false},
      {"make a directory", [](auto& at) { return outcome(::mkdir((at + "new").c_str(), 0700) == 0); }, true, false},
      {"replace", [](auto& at) { return outcome(::rename((at + "file").c_str(), (at + "b").c_str()) == 0); }, true,
       false},
      {"remove", [](auto& at) { return outcome(::unlink((at + "file").c_str()) == 0); }, true, false},
      {"remove a directory", [](auto& at) { return outcome(::rmdir((at + "empty").c_str()) == 0); }, true, false},
      {"bind a socket", [](auto& at) { return binding(at + "socket"); }, true, false},
      {"link symbolically", [](auto& at) { return outcome(::symlink("/", (at + "link").c_str()) == 0); }, false, false},
      {"make a pipe", [](auto& at) { return outcome(::mkfifo((at + "pipe").c_str(), 0600) == 0); }, false, false},
      {"climb out", [](auto& at) { return opening(at + "../profiles/com.kovalt.test.plist", O_RDONLY); }, false, false},
      {"run", run, false, false},
  };
  const auto verdict = [](bool allowed) { return allowed ? "done" : "Permission denied"; };
  for (const auto& row : rows) {
    // Each in a process of its own; what one has changed is put back for the next.
    EXPECT_EQ(entered([&] { return row.operation(directory / "open/"); }), verdict(row.inOpen)) << row.what;
    EXPECT_EQ(entered([&] { return row.operation(directory / "readable/"); }), verdict(row.inReadable)) << row.what;
    EXPECT_EQ(entered([&] { return row.operation(directory / "closed/"); }), verdict(false)) << row.what;
    fs::remove_all(directory / "open");
    fillDirectory("open");
  }
}

TEST_F(SandboxTest, saysWhatWasEnteredAndWhatIsNotThere) {
  writeUsualProfile();
  EXPECT_THAT(inChild([&] { return enter().value()->description(); }),
              testing::MatchesRegex("sandbox profile com.kovalt.test: 2 file rules, Landlock ABI [0-9]+, [0-9]+ system "
                                    "calls, not present: \\$.ABSENT. /no/such/directory"));
  EXPECT_EQ(entered([] { return std::to_string(::prctl(PR_GET_NO_NEW_PRIVS, 0, 0, 0, 0)); }), "1");
}

TEST_F(SandboxTest, holdsForProcessesThatComeLaterAndNotForDescriptorsFromBefore) {
  writeUsualProfile();
  const UniqueFd file(::open((directory / "closed/file").c_str(), O_RDONLY | O_CLOEXEC));
  EXPECT_EQ(entered([&] { return inChild([&] { return opening(directory / "closed/file", O_RDONLY); }); }),
            "Permission denied");
  EXPECT_EQ(entered([&] {
              char buffer[16] = {};
              return ::read(file.get(), buffer, sizeof buffer) == 7 ? std::string(buffer) : outcome(false);
            }),
            "content");
}

TEST_F(SandboxTest, aFilesRealDirectoryIsOpenedSoThatItsReplacementIsReadable) {
  const std::string file = directory.write("real/resolv.conf", "old"), fresh = directory.write("real/fresh", "new");
  fs::create_directory(directory / "etc");
  fs::create_symlink(file, directory / "etc/resolv.conf");
  const Array access{"read", "create", "remove"};
  writeProfile({Dictionary{{"directoriesOf", Array{directory / "etc/resolv.conf"}}, {"access", access}}});
  EXPECT_EQ(entered([&] {
              if (::rename(fresh.c_str(), file.c_str()) != 0) return "renaming: " + outcome(false);
              return opening(directory / "etc/resolv.conf", O_RDONLY);
            }),
            "done");
}

TEST_F(SandboxTest, failsWithTheStepAndTheReason) {
  const std::string start = "sandbox profile com.kovalt.test: ";
  const auto failure = [&] { return entered([] { return "entered"; }); };
  EXPECT_THAT(failure(), testing::AllOf(testing::StartsWith(start), testing::HasSubstr(kFile),
                                        testing::HasSubstr("No such file or directory")));

  const struct {
    const char* key;
    std::string path;
    std::string error;
  } rows[] = {
      {"paths", "/no/such/directory", "cannot open /no/such/directory: No such file or directory"},
      {"paths", "${ABSENT}", "${ABSENT} has a variable without a value"},
      {"paths", "/", "/ leads to the root directory, which is not opened up"},
      {"directoriesOf", "/no/such/file", "cannot resolve /no/such/file: No such file or directory"},
      {"directoriesOf", "${UNKNOWN}/x", "${UNKNOWN}/x has a variable without a value"},
      {"directoriesOf", "/etc/..", "/etc/.. leads to the root directory, which is not opened up"},
  };
  for (const auto& row : rows) {
    writeProfile({Dictionary{{row.key, Array{row.path}}, {"access", Array{"read"}}}});
    EXPECT_EQ(failure(), start + row.error);
    writeProfile({Dictionary{{row.key, Array{row.path}}, {"access", Array{"read"}}, {"optional", true}}});
    EXPECT_EQ(failure(), "entered") << row.path;
  }
}

// The profile as it is shipped, for a daemon whose directories are below the test's. What it forbids is tried inside
// the real daemon.
class ShippedSandboxTest : public SandboxTest {
 protected:
  void SetUp() override {
    SandboxTest::SetUp();
    for (const char* name : {"run", "state", "etc", "share"}) fs::create_directory(directory / name);
    directory.write(kFile, *writeXmlPropertyList(shippedProfile()));
  }
  std::string work(const std::function<std::string()>& body) const {
    return inChild([&] {
      const auto sandbox = Sandbox::enter(directory / "profiles", kProfile,
                                          {{"RUNTIME_DIRECTORY", directory / "run"},
                                           {"STATE_DIRECTORY", directory / "state"},
                                           {"CONFIGURATION_DIRECTORY", directory / "etc"},
                                           {"ORVANTA_FRAMEWORK", directory / "share"},
                                           {"ORVANTA_PLUGINS", directory / "PlugIns"},
                                           {"ORVANTA_CA_DIRECTORY", ""}});
      if (!sandbox) return sandbox.error();
      const auto started = (*sandbox)->started();
      return started ? body() : started.error();
    });
  }
};

// Also what the daemon does only on some machines or in some configurations.
TEST_F(ShippedSandboxTest, letsTheDaemonWork) {
  const bool hasZones = fs::exists("/usr/share/zoneinfo/Asia/Tokyo");
  EXPECT_EQ(work([&] {
              std::string failed;
              addrinfo* found = nullptr;
              const std::string socket = directory / "run/com.kovalt.orvantad";
              if (binding(socket) != "done" || ::unlink(socket.c_str()) != 0) failed += "its socket ";
              if (::mkdir((directory / "state/Logs").c_str(), 0700) != 0) failed += "logs ";
              if (::getpwnam("root") == nullptr) failed += "user names ";
              if (::getaddrinfo("localhost", "80", nullptr, &found) != 0) failed += "host names ";
              ::setenv("TZ", ":Asia/Tokyo", 1);
              ::tzset();
              if (timezone != (hasZones ? -32400 : 0)) failed += "time zones ";
              if (::dlopen("libresolv.so.2", RTLD_NOW) == nullptr) failed += "libraries ";
              if (opening("/dev/null", O_RDWR) != "done") failed += "/dev/null ";
              if (opening("/proc/self/status", O_RDONLY) != "done") failed += "/proc";
              return failed;
            }),
            "");
}

TEST_F(ShippedSandboxTest, tcpPortsCannotBeBoundWhereTheKernelKnowsHow) {
  if (Landlock::create()->abi() < 4) GTEST_SKIP() << "this kernel does not";
  EXPECT_EQ(work([] {
              const UniqueFd socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
              const sockaddr_in any{};
              return outcome(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&any), sizeof any) == 0);
            }),
            "Permission denied");
}

// In a thread that blocks every signal, too, as the C library does while it starts one.
TEST_F(ShippedSandboxTest, aRefusedCallIsLoggedOnceByItsName) {
  const std::string lines = work([] {
    const LogCapture log;
    sigset_t all;
    ::sigfillset(&all);
    ::pthread_sigmask(SIG_SETMASK, &all, nullptr);
    for (int i = 0; i < 3; ++i) {
      if (::inotify_init1(0) >= 0 || errno != ENOSYS || ::socket(AF_PACKET, SOCK_RAW, 0) >= 0) return std::string("?");
    }
    // Answers come before their log lines; those of one call are written before the next is answered.
    while (log.count("socket") == 0) ::sched_yield();
    std::string text;
    for (const auto& line : log.lines()) text += line + "\n";
    return text;
  });
  const std::string end = " in thread [0-9]+; further ones are not logged\n";
  EXPECT_THAT(lines,
              testing::MatchesRegex("<4>sandbox: Refused system call inotify_init1 \\([0-9]+\\)" + end +
                                    "<4>sandbox: Refused system call socket \\([0-9]+\\) with such arguments" + end));
}

// As in some containers: the kernel takes one watcher only, and calls are then refused without a line.
TEST_F(ShippedSandboxTest, callsAreRefusedAllTheSameWhereAnotherProcessWatchesAlready) {
  const std::string result = inChild([&] {
    sock_filter allow = BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW);
    const sock_fprog program{1, &allow};
    ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
    const UniqueFd watcher(
        static_cast<int>(::syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, SECCOMP_FILTER_FLAG_NEW_LISTENER, &program)));
    if (!watcher && errno != EBUSY) return "no watcher: " + outcome(false);  // busy: it is such a container
    return work([] { return outcome(::inotify_init1(0) >= 0); });
  });
  EXPECT_EQ(result, "Function not implemented");
}

}  // namespace
}  // namespace orvanta::platform
