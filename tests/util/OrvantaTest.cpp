#include "util/Orvanta.h"

#include <gmock/gmock.h>

#include <filesystem>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"
#include "tests/util/SignedStorebag.h"

namespace orvanta {
namespace {

TEST(Orvanta, readsTheBundlesVersion) {
  struct Row {
    const char* what;
    std::optional<std::string> file;
    std::string version;
    bool logged;
  };
  const auto plist = [](const std::string& content) { return "<plist version=\"1.0\">" + content + "</plist>"; };
  const Row rows[] = {
      {"a text", plist("<dict><key>version</key><string>8.1.2</string></dict>"), "8.1.2", false},
      {"a number", plist("<dict><key>version</key><integer>9</integer></dict>"), "9", false},
      {"no file", std::nullopt, "8.0", false},
      {"no version", plist("<dict><key>Version</key><string>9</string></dict>"), "8.0", true},
      {"another type", plist("<dict><key>version</key><array/></dict>"), "8.0", true},
      {"no dictionary", plist("<string>8.1</string>"), "8.0", true},
      {"malformed", "<plist><dict><key>version", "8.0", true},
      {"empty", "", "8.0", true},
  };
  for (const Row& row : rows) {
    test::TestPlatform platform;
    if (row.file) platform.directory.write("share/framework.plist", *row.file);
    const test::LogCapture log;
    EXPECT_EQ(Orvanta::of(platform).bundleVersion(), row.version) << row.what;
    EXPECT_EQ(log.count("<4>bundleVersion: "), row.logged ? 1 : 0) << row.what;
  }
}

TEST(Orvanta, theShippedBundleHasAVersionOfThreeNumbers) {
  test::TestPlatform platform;
  std::filesystem::copy_file(ORVANTA_SOURCE_DIR "/packaging/share/orvanta/framework.plist",
                             platform.directory / "share/framework.plist");
  EXPECT_THAT(Orvanta::of(platform).bundleVersion(), testing::MatchesRegex("[0-9]+\\.[0-9]+\\.[0-9]+"));
}

TEST(Orvanta, keepsTheKeyOnceItHasOne) {
  test::TestPlatform platform;
  Orvanta& orvanta = Orvanta::of(platform);
  EXPECT_FALSE(orvanta.publicKey());
  const auto install = [&](const test::Bytes& bytes) {
    platform.directory.write("share/publicKey.der", {reinterpret_cast<const char*>(bytes.data()), bytes.size()});
  };
  const auto der = test::StorebagSigner().publicKeyDer(test::KeyLayout::pkcs1);
  for (const test::Bytes& unusable :
       {test::Bytes{}, test::Bytes(70'000, 0x30), test::Bytes(der.begin(), der.end() - 1)}) {
    install(unusable);
    EXPECT_FALSE(orvanta.publicKey());
  }
  std::filesystem::remove(platform.directory / "share/publicKey.der");
  std::filesystem::create_directory(platform.directory / "share/publicKey.der");
  EXPECT_FALSE(orvanta.publicKey());
  std::filesystem::remove(platform.directory / "share/publicKey.der");
  install(der);
  const auto key = orvanta.publicKey();
  ASSERT_TRUE(key);
  std::filesystem::remove(platform.directory / "share/publicKey.der");
  EXPECT_EQ(orvanta.publicKey(), key);
  EXPECT_EQ(&Orvanta::of(platform), &orvanta);
}

TEST(Orvanta, keepsOneIdentifierPerStandOnConsent) {
  test::TestPlatform platform;
  Orvanta& orvanta = Orvanta::of(platform);
  const std::string respect = orvanta.getPersistentIdentifierForDNU(true);
  const std::string override = orvanta.getPersistentIdentifierForDNU(false);
  EXPECT_THAT(respect, testing::MatchesRegex("[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}"));
  EXPECT_NE(respect, override);
  Orvanta afterRestart(platform);
  EXPECT_EQ(afterRestart.getPersistentIdentifierForDNU(true), respect);
  EXPECT_EQ(afterRestart.getPersistentIdentifierForDNU(false), override);
  platform::UserDefaults stored(platform.get().files().stateDirectory, "com.kovalt.orvanta");
  EXPECT_EQ(stored.text("uuid-respect-dnu"), respect);
  EXPECT_EQ(stored.text("uuid-override-dnu"), override);
}

}  // namespace
}  // namespace orvanta
