#include "backends/BriskBackend.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {

using platform::Dictionary;

constexpr const char* kLibrary = "/Tamberline.bundle/Bundles/HQXPerformance.bundle/HQXPerformance.so";
constexpr const char* kNotResponding = " does not respond to forwarding selector sendMessageWithMethod:respCode:dict:";

class BriskBackendTest : public ::testing::Test {
 protected:
  std::string libraryPath() { return platform.get().files().plugInsDirectory + kLibrary; }
  void install(const std::string& library) {
    std::filesystem::create_directories(std::filesystem::path(libraryPath()).parent_path());
    std::filesystem::copy_file(library, libraryPath());
  }
  std::shared_ptr<BriskBackend> make(std::int32_t clientType) {
    return BriskBackend::create(platform, "brisk", nullptr, "Parva", clientType);
  }

  test::TestPlatform platform;
  test::LogCapture log;
};

TEST_F(BriskBackendTest, ForwardsMethodCodeAndPayload) {
  install(SAMPLE_ADAPTOR);
  ::setenv("STATE_DIRECTORY", platform.directory.path().c_str(), 1);
  for (const std::int32_t clientType : {7, 11, 13}) {
    const auto backend = make(clientType);
    ASSERT_NE(backend, nullptr);
    EXPECT_EQ(backend->sendMessage(std::make_shared<const Dictionary>(Dictionary{{"k", "v"}, {"n", clientType}}), {},
                                   65535, 2, 1),
              std::nullopt);
    backend->sendMessage(nullptr, {}, 3, 4, 0);
    backend->sendMessage(std::make_shared<const Dictionary>(), {}, 0, 0, 0);
  }
  ::unsetenv("STATE_DIRECTORY");
  std::stringstream content;
  content << std::ifstream(platform.directory / "adaptor.log").rdbuf();
  EXPECT_EQ(content.str(),
            "65535 2 {\"k\":\"v\",\"n\":7}\n3 4 null\n0 0 {}\n"
            "65535 2 {\"k\":\"v\",\"n\":11}\n3 4 null\n0 0 {}\n"
            "65535 2 {\"k\":\"v\",\"n\":13}\n3 4 null\n0 0 {}\n");
  EXPECT_EQ(log.count("BundleLoader(load): Loaded"), 1U);
  EXPECT_EQ(log.count("<3>"), 0U);
}

TEST_F(BriskBackendTest, RefusesOtherClientTypes) {
  for (const std::int32_t clientType : {0, 6, 8, 12, 14, 18, 263, -7}) {
    log.clear();
    EXPECT_EQ(make(clientType), nullptr);
    const std::string number = std::to_string(clientType);
    EXPECT_EQ(log.lines(), (std::vector<std::string>{
                               "<6>BriskBackend(initWithName): Loading Brisk adaptor class for client type " + number,
                               "<3>BriskBackend(initWithName): No matching bundle found for client type " + number}));
  }
  EXPECT_EQ(BriskBackend::create(platform, "brisk", nullptr, "Parva"), nullptr);
}

TEST_F(BriskBackendTest, EveryFaultyBundleIsExplainedOnceAndEachEventLeavesALine) {
  const std::string faults = FAULTY_ADAPTORS;
  const struct {
    std::string library;  // empty: none installed
    std::string reason;
    std::string adaptor;
  } rows[] = {
      {"", "cannot open shared object file", "(null)"},
      {platform.directory.write("text", "no shared object"), "Could not load " + libraryPath(), "(null)"},
      {faults + "/faulty_adaptor_0.so", "exports no orvantaPluginBundle", "(null)"},
      {faults + "/faulty_adaptor_1.so", "has plug-in interface version 2, this daemon has 1", "(null)"},
      {faults + "/faulty_adaptor_2.so", "has no class BriskAdaptor", "(null)"},
      {faults + "/faulty_adaptor_3.so", "has no operation sendMessageWithMethod:respCode:dict:", "<BriskAdaptor>"},
      {faults + "/faulty_adaptor_4.so", "The class BriskAdaptor gave no instance", "(null)"},
  };
  for (const auto& row : rows) {
    test::TestPlatform fresh;  // loads anew
    const std::string path = fresh.get().files().plugInsDirectory + kLibrary;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    if (!row.library.empty()) std::filesystem::copy_file(row.library, path);
    log.clear();
    const auto backend = BriskBackend::create(fresh, "brisk", nullptr, "Parva", 7);
    ASSERT_NE(backend, nullptr) << row.reason;
    backend->sendMessage(nullptr, {}, 1, 1, 0);
    backend->sendMessage(nullptr, {}, 1, 1, 0);
    EXPECT_EQ(log.count(row.library.ends_with("text") ? "Could not load " + path : row.reason), 1U)
        << ::testing::PrintToString(log.lines());
    EXPECT_EQ(log.count("<3>BriskBackend(sendMessage): Brisk adaptor " + row.adaptor + kNotResponding), 2U);
    EXPECT_EQ(log.count("<3>"), 3U);
  }
}

TEST_F(BriskBackendTest, ABundleInstalledLaterIsFoundByTheNextBackend) {
  make(7);
  EXPECT_EQ(log.count("<3>BundleLoader(load): Could not load"), 1U);
  install(SAMPLE_ADAPTOR);
  make(7);
  EXPECT_EQ(log.count("<6>BundleLoader(load): Loaded " + libraryPath()), 1U);
}

}  // namespace
}  // namespace orvanta
