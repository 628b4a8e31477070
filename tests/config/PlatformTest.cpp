#include "config/Platform.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

#include "platform/host/Process.h"

namespace orvanta {
namespace {

TEST(FileLocations, comeFromTheEnvironment) {
  // A variable's value, and what becomes of it where the service manager may give several paths, and elsewhere.
  const struct {
    const char* given;
    std::optional<std::string> listed, single;  // nullopt: the default
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

TEST(Process, nothingGetsTheNumberOfAClosedStandardDescriptor) {
  const auto numberAfterSecuring = [] {
    for (const int standard : {0, 1, 2}) ::close(standard);
    platform::secureStandardDescriptors();
    char byte = 0;
    return ::read(0, &byte, 1) == 0 && ::write(1, "x", 1) == 1 ? ::open("/", O_RDONLY) : -1;
  };
  EXPECT_EXIT(::_exit(numberAfterSecuring() > 2 ? 0 : 1), testing::ExitedWithCode(0), "");
}

}  // namespace
}  // namespace orvanta
