#include "config/ConfigServices.h"

#include <gtest/gtest.h>

#include <future>
#include <optional>
#include <string>
#include <tuple>
#include <vector>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta::test {
namespace {

TEST(ConfigServices, findEachFactOutOnceWhateverThreadAsks) {
  TestServices<ConfigServices> device, another;
  ConfigServices& services = device.services;
  const auto ask = [&] {
    return std::tuple(&services.storebagServerURL(), &services.orvanta(), services.storebagLane(),
                      services.isInternalBuild());
  };
  auto other = std::async(std::launch::async, ask);
  const auto mine = ask();
  EXPECT_EQ(mine, other.get());
  EXPECT_EQ(mine, ask());
  device.device.release = another.device.release = "Internal";
  EXPECT_FALSE(services.isInternalBuild());
  EXPECT_TRUE(another.services.isInternalBuild());
  EXPECT_NE(another.services.storebagLane(), services.storebagLane());
}

TEST(StorebagServer, isTheOverrideOrFollowsTheBuildOnce) {
  using Text = std::optional<std::string>;
  const std::string local = "http://127.0.0.1:8080/x";
  const std::tuple<Text, Text, std::string> rows[] = {
      // setting, release type, address
      {std::nullopt, std::nullopt, "https://bags.kovalt.com/bags/tamrel"},
      {std::nullopt, "Internal", "https://internal-bags.kovalt.com/storebags/tamrel"},
      {std::nullopt, "internal", "https://bags.kovalt.com/bags/tamrel"},
      {std::nullopt, "Internal ", "https://bags.kovalt.com/bags/tamrel"},
      {local, "Internal", local},
      {local, std::nullopt, local},
  };
  for (const auto& [setting, releaseType, expected] : rows) {
    TestServices<ConfigServices> platform;
    platform.device.release = releaseType;
    if (setting) {
      ASSERT_TRUE(platform.get().defaults().set("orvanta_storebag_url", *setting));
    }
    EXPECT_EQ(platform.services.storebagServerURL(), expected);
    EXPECT_EQ(platform.services.isInternalBuild(), releaseType == "Internal");
    platform.device.release = releaseType == "Internal" ? "Beta" : "Internal";
    EXPECT_EQ(platform.services.isInternalBuild(), releaseType == "Internal") << "asked again";
    ASSERT_TRUE(platform.get().defaults().set("orvanta_storebag_url", "http://other.kovalt.com"));
    EXPECT_EQ(platform.services.storebagServerURL(), expected) << "asked again";
  }
}

TEST(Environment, isTheSettingOrFollowsTheBuild) {
  const struct {
    Value setting;  // null: not set
    bool internalBuild;
    std::uint32_t expected;
    std::string invalid = "";  // the value that the error line names; empty: no such line
  } rows[] = {
      {nullptr, false, 3},
      {nullptr, true, 2},
      {1, false, 1},
      {4, true, 4},
      {"4", false, 4},
      {"release", false, 0},
      {5, false, 2, "5"},
      {std::int64_t{0x1'0000'0001}, false, 2, "4294967297"},  // not 1 with its upper half cut off
      {-1, false, 2, "4294967295"},
      {"-3", false, 2, "4294967293"},
  };
  for (const auto& row : rows) {
    TestServices<ConfigServices> platform;
    if (row.internalBuild) platform.device.release = "Internal";
    ASSERT_TRUE(platform.get().defaults().set("environmentType", row.setting));
    const LogCapture log;
    std::vector<std::string> lines;
    if (!row.invalid.empty()) lines.push_back("<3>userDefaultsEnvironment: Invalid environment type " + row.invalid);
    lines.push_back("<6>userDefaultsEnvironment: Environment type " + std::to_string(row.expected));
    // Decided once: neither a later setting nor another line.
    for (int asked = 0; asked < 2; ++asked) {
      EXPECT_EQ(static_cast<std::uint32_t>(platform.services.currentEnvironmentType()), row.expected);
      EXPECT_EQ(log.lines(), lines);
      ASSERT_TRUE(platform.get().defaults().set("environmentType", row.expected == 1 ? 4 : 1));
    }
  }
}

}  // namespace
}  // namespace orvanta::test
