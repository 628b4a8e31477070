#include "util/DeviceInfo.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {

using platform::UserDefaults;

constexpr const char* kUuidPattern = "[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}";

TEST(DeviceInfo, copiesTheDeviceIdentifierIntoItsBuffer) {
  const std::string forty(40, 'f');
  const std::string twoBytes = "\xc3\xa9";
  struct Row {
    std::optional<std::string> given;
    std::string expected;
  };
  const Row rows[] = {
      {"0123456789abcdef0123456789abcdef01234567", "0123456789abcdef0123456789abcdef01234567"},
      {"short", "short"},
      {"", ""},
      {forty + "g", forty},
      {std::string(38, 'f') + twoBytes, std::string(38, 'f') + twoBytes},
      {std::string(39, 'f') + twoBytes, std::string(39, 'f')},
      {std::nullopt, "left as it was"},
  };
  for (const Row& row : rows) {
    test::TestPlatform platform;
    platform.device.udid = row.given;
    DeviceIDBuffer buffer{"left as it was"};
    copyUniqueDeviceID(platform, buffer);
    EXPECT_EQ(deviceIDText(buffer), row.expected);
    EXPECT_EQ(buffer.back(), '\0');
  }
}

TEST(DeviceInfo, internalBuildIsDecidedOnce) {
  struct Row {
    std::optional<std::string> releaseType;
    bool expected;
  };
  const Row rows[] = {{"Internal", true}, {"internal", false}, {"Internal ", false},
                      {"Beta", false},    {"", false},         {std::nullopt, false}};
  for (const Row& row : rows) {
    test::TestPlatform platform;
    platform.device.release = row.releaseType;
    EXPECT_EQ(isInternalBuild(platform), row.expected) << row.releaseType.value_or("none");
    platform.device.release = row.expected ? "Beta" : "Internal";
    EXPECT_EQ(isInternalBuild(platform), row.expected) << "asked again";
  }
}

TEST(DeviceInfo, persistentIdentifiersSurviveARestart) {
  struct Row {
    std::optional<std::string> first, second;
    std::string key;
  };
  const Row rows[] = {
      {{}, {}, "uuid::"}, {"Mail", {}, "uuid:Mail:"}, {{}, "Mail", "uuid::Mail"}, {"Mail", "push", "uuid:Mail:push"}};
  test::TestPlatform platform;
  std::vector<std::string> identifiers;
  for (const Row& row : rows) {
    const test::LogCapture log;
    identifiers.push_back(getPersistentIdentifierForCustomClientIDSuffix(platform, row.first, row.second));
    EXPECT_THAT(identifiers.back(), testing::MatchesRegex(kUuidPattern));
    EXPECT_TRUE(log.contains("<6>getPersistentIdentifierForCustomClientIDSuffix: The value for " + row.key + ": " +
                             identifiers.back()));
    UserDefaults afterRestart(platform.get().files().stateDirectory, "com.kovalt.orvanta");
    EXPECT_EQ(afterRestart.text(row.key), identifiers.back());
    EXPECT_EQ(getPersistentIdentifierForCustomClientIDSuffix(platform, row.first, row.second), identifiers.back());
  }
  std::sort(identifiers.begin(), identifiers.end());
  EXPECT_EQ(std::unique(identifiers.begin(), identifiers.end()), identifiers.end());
}

TEST(DeviceInfo, whatSomebodyElseStoredIsThePersistentIdentifier) {
  test::TestPlatform platform;
  ASSERT_TRUE(platform.get().defaults().set("uuid:a:b", "given by hand"));
  ASSERT_TRUE(platform.get().defaults().set("uuid:a:", 12));
  EXPECT_EQ(getPersistentIdentifierForCustomClientIDSuffix(platform, "a", "b"), "given by hand");
  EXPECT_EQ(getPersistentIdentifierForCustomClientIDSuffix(platform, "a", {}), "12");
}

}  // namespace
}  // namespace orvanta
