#include "config/Orvanta.h"

#include <gmock/gmock.h>

#include <filesystem>

#include "tests/config/SignedStorebag.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {

TEST(Orvanta, readsTheBundlesVersion) {
  const std::tuple<const char*, const char*, std::size_t> rows[] = {
      // content of the file, version, lines
      {"<plist><dict><key>version</key><string>8.1.2</string></dict></plist>", "8.1.2", 0},
      {"<plist><dict><key>version</key><integer>9</integer></dict></plist>", "9", 0},
      {nullptr, "8.0", 0},
      {"<plist><dict><key>Version</key><string>9</string></dict></plist>", "8.0", 1},
      {"<plist><dict><key>version</key><array/></dict></plist>", "8.0", 1},
      {"", "8.0", 1},
  };
  for (const auto& [file, version, lines] : rows) {
    test::TestPlatform platform;
    if (file != nullptr) platform.directory.write("share/framework.plist", file);
    const test::LogCapture log;
    EXPECT_EQ(Orvanta(platform).bundleVersion(), version);
    EXPECT_EQ(log.count("<4>bundleVersion: "), lines) << file;
  }
}

TEST(Orvanta, theShippedBundleHasAVersionOfThreeNumbers) {
  test::TestPlatform platform;
  std::filesystem::copy_file(ORVANTA_SOURCE_DIR "/packaging/share/orvanta/framework.plist",
                             platform.directory / "share/framework.plist");
  EXPECT_THAT(Orvanta(platform).bundleVersion(), testing::MatchesRegex("[0-9]+\\.[0-9]+\\.[0-9]+"));
}

TEST(Orvanta, keepsTheKeyOnceItHasOne) {
  test::TestPlatform platform;
  Orvanta orvanta(platform);
  EXPECT_FALSE(orvanta.publicKey());
  const std::string file = platform.directory / "share/publicKey.der";
  const auto der = test::StorebagSigner().publicKeyDer(test::KeyLayout::pkcs1);
  for (const auto& unusable : {test::Bytes{}, test::Bytes(70'000, 0x30), test::Bytes(der.begin(), der.end() - 1)}) {
    installKey(platform, unusable);
    EXPECT_FALSE(orvanta.publicKey());
  }
  std::filesystem::remove(file);
  std::filesystem::create_directory(file);
  EXPECT_FALSE(orvanta.publicKey());
  std::filesystem::remove(file);
  installKey(platform, der);
  const auto key = orvanta.publicKey();
  ASSERT_TRUE(key);
  std::filesystem::remove(file);
  EXPECT_EQ(orvanta.publicKey(), key);
}

TEST(Orvanta, keepsOneIdentifierPerStandOnConsent) {
  test::TestPlatform platform;
  Orvanta orvanta(platform);
  const std::string respect = orvanta.getPersistentIdentifierForDNU(true);
  const std::string override = orvanta.getPersistentIdentifierForDNU(false);
  EXPECT_THAT(respect, testing::MatchesRegex("[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}"));
  EXPECT_NE(respect, override);
  Orvanta afterRestart(platform);
  EXPECT_EQ(afterRestart.getPersistentIdentifierForDNU(true), respect);
  EXPECT_EQ(afterRestart.getPersistentIdentifierForDNU(false), override);
  EXPECT_EQ(platform.get().defaults().text("uuid-respect-dnu"), respect);
  EXPECT_EQ(platform.get().defaults().text("uuid-override-dnu"), override);
}

}  // namespace
}  // namespace orvanta
