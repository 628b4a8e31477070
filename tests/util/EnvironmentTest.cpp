#include "util/Environment.h"

#include <gtest/gtest.h>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {

using platform::Value;

TEST(Environment, isTheSettingOrFollowsTheBuild) {
  struct Row {
    std::optional<Value> setting;
    bool internalBuild;
    std::uint32_t expected;
    std::string invalid;  // the value that the error line names; empty: no such line
  };
  const Row rows[] = {
      {std::nullopt, false, 3, ""},
      {std::nullopt, true, 2, ""},
      {Value(0), true, 0, ""},
      {Value(1), false, 1, ""},
      {Value(2), false, 2, ""},
      {Value(3), true, 3, ""},
      {Value(4), true, 4, ""},
      {Value("4"), false, 4, ""},
      {Value(true), false, 1, ""},
      {Value("release"), false, 0, ""},
      {Value(5), false, 2, "5"},
      {Value(7), false, 2, "7"},
      {Value(std::int64_t{0x1'0000'0001}), false, 2, "4294967297"},  // not 1 with its upper half cut off
      {Value(-1), false, 2, "4294967295"},
      {Value("-3"), false, 2, "4294967293"},
  };
  for (const Row& row : rows) {
    test::TestPlatform platform;
    if (row.internalBuild) platform.device.release = "Internal";
    if (row.setting) {
      ASSERT_TRUE(platform.get().defaults().set("environmentType", *row.setting));
    }
    const test::LogCapture log;
    EXPECT_EQ(static_cast<std::uint32_t>(currentEnvironmentType(platform)), row.expected);
    std::vector<std::string> lines;
    if (!row.invalid.empty()) lines.push_back("<3>userDefaultsEnvironment: Invalid environment type " + row.invalid);
    lines.push_back("<6>userDefaultsEnvironment: Environment type " + std::to_string(row.expected));
    EXPECT_EQ(log.lines(), lines);
    // Decided once: neither a later setting nor another line.
    ASSERT_TRUE(platform.get().defaults().set("environmentType", row.expected == 1 ? 4 : 1));
    EXPECT_EQ(static_cast<std::uint32_t>(currentEnvironmentType(platform)), row.expected);
    EXPECT_EQ(log.lines(), lines);
  }
}

TEST(Environment, namesItsSection) {
  EXPECT_EQ(environmentSectionName(EnvironmentType::none), nullptr);
  EXPECT_STREQ(environmentSectionName(EnvironmentType::development), "development");
  EXPECT_STREQ(environmentSectionName(EnvironmentType::internal), "kovalt_internal");
  EXPECT_STREQ(environmentSectionName(EnvironmentType::seed), "seed");
  EXPECT_STREQ(environmentSectionName(EnvironmentType::release), "release");
}

}  // namespace
}  // namespace orvanta
