#include "config/Platform.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <future>
#include <string>
#include <vector>

#include "platform/host/Process.h"
#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {

TEST(FileLocations, comeFromTheEnvironment) {
  // A variable's value, and what becomes of it where the service manager may give several paths, and elsewhere.
  const struct {
    const char* given;
    std::optional<std::string> listed, single;  // none: the default
  } rows[] = {
      {"/srv/a", "/srv/a", "/srv/a"},
      {"/srv/a///", "/srv/a", "/srv/a"},
      {"/srv/a/:/srv/b", "/srv/a", "/srv/a/:/srv/b"},
      {"/", "/", "/"},
      {":/srv/b", {}, ":/srv/b"},
      {"", {}, {}},
      {nullptr, {}, {}},
  };
  const FileLocations defaults;
  for (const auto& [given, listed, single] : rows) {
    for (const char* name : {"RUNTIME_DIRECTORY", "STATE_DIRECTORY", "CONFIGURATION_DIRECTORY", "ORVANTA_FRAMEWORK",
                             "ORVANTA_PLUGINS", "ORVANTA_CA_FILE"}) {
      given == nullptr ? ::unsetenv(name) : ::setenv(name, given, 1);
    }
    const FileLocations locations = FileLocations::fromEnvironment();
    EXPECT_EQ(locations.runtimeDirectory, listed.value_or(defaults.runtimeDirectory));
    EXPECT_EQ(locations.stateDirectory, listed.value_or(defaults.stateDirectory));
    EXPECT_EQ(locations.configurationDirectory, listed.value_or(defaults.configurationDirectory));
    EXPECT_EQ(locations.frameworkDirectory, single.value_or(defaults.frameworkDirectory));
    EXPECT_EQ(locations.plugInsDirectory, single.value_or(defaults.plugInsDirectory));
    EXPECT_EQ(locations.caFile, single.value_or(""));
  }
}

TEST(Platform, makesEachOnceValueOnceWhateverThreadAsks) {
  struct Inner {
    int value;
  };
  struct Outer {
    int value;
  };
  orvanta::test::TestPlatform device;
  Platform& platform = device;
  std::atomic<int> made{0};
  const auto ask = [&] {
    return &platform.once<Outer>([&] { return Outer{platform.once<Inner>([&] { return Inner{++made}; }).value + 10}; });
  };
  auto other = std::async(std::launch::async, ask);
  const Outer* mine = ask();
  EXPECT_EQ(mine, other.get());
  EXPECT_EQ(mine->value, 11);
  EXPECT_EQ(made, 1);
  orvanta::test::TestPlatform another;
  EXPECT_EQ(another.get().once<Inner>([] { return Inner{5}; }).value, 5);
}

TEST(Process, nothingGetsTheNumberOfAClosedStandardDescriptor) {
  const auto numberAfterSecuring = [] {
    for (const int standard : {0, 1, 2}) ::close(standard);
    platform::secureStandardDescriptors();
    char byte = 0;
    return ::read(0, &byte, 1) == 0 && ::write(1, "x", 1) == 1 ? ::open("/", O_RDONLY) : -1;
  };
  EXPECT_EXIT(::_exit(numberAfterSecuring() > 2 ? 0 : 1), testing::ExitedWithCode(0), "");
}

using Ends = std::vector<std::string>;

class TellingHttpClient final : public orvanta::test::ScriptedHttpClient {
 public:
  TellingHttpClient(platform::WorkPool& pool, Ends& ends) : _pool(pool), _ends(ends) {}
  ~TellingHttpClient() override { _ends.emplace_back("client destroyed"); }
  void shutdown(std::chrono::milliseconds) override {
    EXPECT_EQ(_pool.threadCount(), 1U) << "nobody would run the last completions";
    _ends.emplace_back("client shut down");
  }

 private:
  platform::WorkPool& _pool;
  Ends& _ends;
};

// What a once-value holds of the client and the pool must go while they are there.
TEST(Platform, endsItsPartsInOrder) {
  Ends ends;
  {
    Platform::Parts parts;
    parts.pool = std::make_unique<platform::WorkPool>(1);
    parts.pool->start();
    parts.http = std::make_unique<TellingHttpClient>(*parts.pool, ends);
    Platform platform(std::move(parts));
    using Telling = std::shared_ptr<void>;
    platform.once<Telling>([&] {
      return Telling(nullptr, [&](void*) {
        EXPECT_EQ(platform.pool().threadCount(), 0U) << "a job may still use it";
        ends.emplace_back("once-value destroyed");
        platform.pool().post([last = Telling(nullptr, [&](void*) { ends.emplace_back("pool destroyed"); })] {});
      });
    });
    std::promise<void> ran;
    platform.pool().post([&] {
      ends.emplace_back("job");
      ran.set_value();
    });
    ran.get_future().get();
  }
  EXPECT_EQ(ends, (Ends{"job", "client shut down", "once-value destroyed", "client destroyed", "pool destroyed"}));
}

}  // namespace
}  // namespace orvanta
