#include "config/DeviceInfo.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <set>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {

using platform::UserDefaults;

constexpr const char* kUuidPattern = "[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}";

TEST(DeviceInfo, copiesTheDeviceIdentifierIntoItsBuffer) {
  const std::string forty(40, 'f'), umlaut = "é";
  const std::pair<std::optional<std::string>, std::string> rows[] = {
      {forty, forty},
      {"short", "short"},
      {forty + "g", forty},
      {forty.substr(2) + umlaut, forty.substr(2) + umlaut},
      {forty.substr(1) + umlaut, forty.substr(1)},
      {std::nullopt, "left as it was"},
  };
  for (const auto& [given, expected] : rows) {
    test::TestPlatform platform;
    platform.device.udid = given;
    DeviceIDBuffer buffer{"left as it was"};
    copyUniqueDeviceID(platform, buffer);
    EXPECT_EQ(deviceIDText(buffer), expected);
    EXPECT_EQ(buffer.back(), '\0');
  }
}

TEST(DeviceInfo, persistentIdentifiersSurviveARestart) {
  const std::tuple<std::optional<std::string>, std::optional<std::string>, std::string> rows[] = {
      {{}, {}, "uuid::"}, {"Mail", {}, "uuid:Mail:"}, {{}, "Mail", "uuid::Mail"}, {"Mail", "push", "uuid:Mail:push"}};
  test::TestPlatform platform;
  std::set<std::string> identifiers;
  for (const auto& [first, second, key] : rows) {
    const test::LogCapture log;
    const std::string made = getPersistentIdentifierForCustomClientIDSuffix(platform, first, second);
    EXPECT_THAT(made, testing::MatchesRegex(kUuidPattern));
    EXPECT_TRUE(identifiers.insert(made).second);
    EXPECT_TRUE(log.contains("<6>getPersistentIdentifierForCustomClientIDSuffix: The value for " + key + ": " + made));
    UserDefaults afterRestart(platform.get().files().stateDirectory, "com.kovalt.orvanta");
    EXPECT_EQ(afterRestart.text(key), made);
    EXPECT_EQ(getPersistentIdentifierForCustomClientIDSuffix(platform, first, second), made);
  }
  // A value that another program has stored there is the identifier.
  ASSERT_TRUE(platform.get().defaults().set("uuid:a:b", "given by hand"));
  ASSERT_TRUE(platform.get().defaults().set("uuid:a:", 12));
  EXPECT_EQ(getPersistentIdentifierForCustomClientIDSuffix(platform, "a", "b"), "given by hand");
  EXPECT_EQ(getPersistentIdentifierForCustomClientIDSuffix(platform, "a", {}), "12");
}

}  // namespace
}  // namespace orvanta
