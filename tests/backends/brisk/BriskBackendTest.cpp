#include "backends/brisk/BriskBackend.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <tuple>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {

constexpr const char* kLibrary = "/Tamberline.bundle/Bundles/HQXPerformance.bundle/HQXPerformance.so";
constexpr const char* kFifo = "a FIFO";
constexpr const char* kNotResponding = " does not respond to forwarding selector sendMessageWithMethod:respCode:dict:";

class BriskBackendTest : public ::testing::Test {
 protected:
  static std::string libraryPath(test::TestServices<BackendServices>& on) {
    return on.get().files().plugInsDirectory + kLibrary;
  }
  static void install(test::TestServices<BackendServices>& on, const std::string& library) {
    std::filesystem::create_directories(std::filesystem::path(libraryPath(on)).parent_path());
    if (library == kFifo) {
      ASSERT_EQ(::mkfifo(libraryPath(on).c_str(), 0600), 0);
    } else {
      std::filesystem::copy_file(library, libraryPath(on));
    }
  }
  static std::shared_ptr<BriskBackend> make(test::TestServices<BackendServices>& on, std::int32_t clientType) {
    BackendSetup setup;
    setup.identity.clientType = clientType;
    return BriskBackend::create(on, "brisk", nullptr, setup);
  }

  test::TestServices<BackendServices> platform;
  test::LogCapture log;
};

TEST_F(BriskBackendTest, RefusesOtherClientTypes) {
  for (const std::int32_t clientType : {0, 6, 8, 12, 14, 18, 263, -7}) {
    log.clear();
    EXPECT_EQ(make(platform, clientType), nullptr);
    const std::string number = std::to_string(clientType);
    EXPECT_EQ(log.lines(), (std::vector<std::string>{
                               "<6>BriskBackend(initWithName): Loading Brisk adaptor class for client type " + number,
                               "<3>BriskBackend(initWithName): No matching bundle found for client type " + number}));
  }
}

TEST_F(BriskBackendTest, EveryFaultyBundleIsExplainedOnceAndEachEventLeavesALine) {
  const std::string faults = FAULTY_ADAPTORS;
  const std::tuple<std::string, std::string, std::string> rows[] = {
      // library, reason, adaptor
      {"", "cannot open shared object file", "(null)"},
      {platform.directory.write("text", "no shared object"), "Could not load ", "(null)"},
      {kFifo, "not a regular file", "(null)"},  // opening it would wait for a writer
      {faults + "/faulty_adaptor_0.so", "exports no orvantaPluginBundle", "(null)"},
      {faults + "/faulty_adaptor_1.so", "has plug-in interface version 2, this daemon has 1", "(null)"},
      {faults + "/faulty_adaptor_2.so", "has no class BriskAdaptor", "(null)"},
      {faults + "/faulty_adaptor_3.so", "has no operation sendMessageWithMethod:respCode:dict:", "<BriskAdaptor>"},
      {faults + "/faulty_adaptor_4.so", "The class BriskAdaptor gave no instance", "(null)"},
  };
  for (const auto& [library, reason, adaptor] : rows) {
    test::TestServices<BackendServices> fresh;  // loads anew
    if (!library.empty()) install(fresh, library);
    log.clear();
    const auto backend = make(fresh, 7);
    ASSERT_NE(backend, nullptr) << reason;
    Event event{.category = 1, .type = 1};
    for (int i = 0; i < 2; ++i) backend->sendMessage(event);
    EXPECT_EQ(log.count(reason), 1U) << ::testing::PrintToString(log.lines());
    EXPECT_EQ(log.count("<3>BriskBackend(sendMessage): Brisk adaptor " + adaptor + kNotResponding), 2U);
    EXPECT_EQ(log.count("<3>"), 3U);
  }
}

TEST_F(BriskBackendTest, ABundleInstalledLaterIsFoundByTheNextBackend) {
  make(platform, 7);
  EXPECT_EQ(log.count("<3>BundleLoader(load): Could not load"), 1U);
  install(platform, SAMPLE_ADAPTOR);
  make(platform, 7);
  EXPECT_EQ(log.count("<6>BundleLoader(load): Loaded " + libraryPath(platform)), 1U);
}

}  // namespace
}  // namespace orvanta
