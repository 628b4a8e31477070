#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "platform/host/UserDefaults.h"
#include "platform/ipc/Connect.h"
#include "tests/integration/IntegrationFixture.h"
#include "tests/platform/Waiting.h"
#include "tests/support/ServiceManager.h"

namespace orvanta::test {
namespace {

namespace fs = std::filesystem;

// Reports that leave the daemon other than by the network, and its messages to the service manager.
class AdaptorTest : public IntegrationFixture {
 protected:
  void SetUp() override {
    IntegrationFixture::SetUp();
    options.environment["ORVANTA_PLUGINS"] = SAMPLE_PLUGINS;
    setSection({{"brisk", Dictionary{}}, {"voltmark", Dictionary{}}});
  }
  std::unique_ptr<OrvantaConnection> sessionOfType(std::int32_t clientType) {
    return openSession({.sessionID = 1, .clientType = clientType});
  }
  // An event with a payload, and one without.
  void sendBoth(OrvantaConnection& session) {
    send(session, event(65535, 2, {{"text", "hello"}, {"list", Array{1, true, Value()}}}));
    MessageParameters bare = event(3, 4);
    bare.payload.reset();
    send(session, bare);
  }
};

TEST_F(AdaptorTest, EventsOfItsClientTypesReachTheAdaptorWithTheServerUpAndDown) {
  const auto url = options.storebagURL;
  for (const std::int32_t clientType : {7, 11, 13}) {
    for (const bool serverUp : {true, false}) {
      options.storebagURL = serverUp ? url : "http://127.0.0.1:1/storebags";
      startDaemon();
      BackendNames names;
      auto session = openSession({.sessionID = 1, .clientType = clientType}, {}, &names);
      EXPECT_TRUE(serverUp || names == std::vector<std::string>{"brisk"});
      EXPECT_EQ(daemon->count("<6>fetchStorebagWithName: Loading default storebag 'confluo'"), serverUp ? 0U : 1U);
      sendBoth(*session);
      const std::string events = daemon->stateFile("adaptor.log");
      EXPECT_TRUE(events.starts_with("0 0 ")) << "the session's own start comes first: " << events;
      EXPECT_TRUE(events.ends_with("\n65535 2 {\"list\":[1,true,null],\"text\":\"hello\"}\n3 4 null\n")) << events;
      EXPECT_EQ(daemon->count("BundleLoader(load): Loaded"), 1U);
      EXPECT_EQ(daemon->count("<3>Brisk"), 0U);
      session.reset();
      EXPECT_EQ(daemon->terminate(), 0);
    }
  }
}

TEST_F(AdaptorTest, OtherClientTypesAndDesktopDevicesHaveNoAdaptor) {
  startDaemon();
  sendBoth(*sessionOfType(12));
  EXPECT_EQ(daemon->count("<3>BriskBackend(initWithName): No matching bundle found for client type 12"), 1U);
  EXPECT_EQ(daemon->terminate(), 0);
  options.device.set("ProductType", "Deskora");
  startDaemon();
  sendBoth(*sessionOfType(7));
  EXPECT_EQ(daemon->count("BriskBackend"), 0U);
}

TEST_F(AdaptorTest, ThePowerLogIsThePlatformsWhereThereIsOneElseAFile) {
  for (const bool library : {false, true}) {
    if (library) options.environment["LD_LIBRARY_PATH"] = SAMPLE_PLUGINS;
    startDaemon();
    auto session = sessionOfType(5);
    sendBoth(*session);                       // the second is empty
    send(*session, event(0, 9, {{"x", 1}}));  // bookkeeping's category
    send(*session, event(5, 2, {{"x", 1}, {"method", "theirs"}}));
    const std::string first = R"({"event":2,"list":[1,true,null],"method":65535,"respCode":2,"text":"hello"})";
    const std::string second = R"({"event":5,"method":5,"respCode":2,"x":1})";
    if (library) {
      EXPECT_EQ(daemon->stateFile("power.log"),
                "28 Vesperd-ORV " + first + " null\n28 Vesperd-ORV " + second + " null\n");
      EXPECT_EQ(daemon->stateFile("powerlog.jsonl"), "");
      EXPECT_EQ(daemon->count("<6>PowerLog(load): Loaded libvoltmark.so.1"), 1U);
    } else {
      std::istringstream lines(daemon->stateFile("powerlog.jsonl"));
      for (const std::string& record : {first, second}) {
        std::string line;
        std::getline(lines, line);
        EXPECT_TRUE(line.starts_with(R"({"event":28,"sender":"Vesperd-ORV","time":)")) << line;
        EXPECT_TRUE(line.ends_with(",\"record\":" + record + "}")) << line;
      }
      EXPECT_EQ(lines.peek(), EOF);
      EXPECT_EQ(daemon->count("<6>PowerLog(load): No platform power log, records go to a file: libvoltmark.so.1:"), 1U);
    }
    session.reset();
    EXPECT_EQ(daemon->terminate(), 0);
  }
}

TEST_F(AdaptorTest, TheServiceManagerHearsHowManySessionsThereAre) {
  const ServiceManager manager;
  options.environment["NOTIFY_SOCKET"] = manager.path();
  startDaemon();
  const auto hears = [&](const std::string& text) {
    return eventually([&] {
      const auto heard = manager.heard();
      return std::find(heard.begin(), heard.end(), text) != heard.end();
    });
  };
  EXPECT_TRUE(hears("READY=1\nSTATUS=idle"));
  auto first = connect();
  auto second = connect();
  EXPECT_TRUE(hears("STATUS=busy; 2 sessions"));
  first.reset();
  EXPECT_TRUE(hears("STATUS=busy; 1 session"));
  second.reset();
  EXPECT_TRUE(hears("STATUS=idle; 0 sessions"));
}

TEST_F(AdaptorTest, AConfigurationThatIsOfNoUseIsToldOnceAtTheStart) {
  startDaemon();
  EXPECT_EQ(daemon->count("<4>"), 0U) << daemon->process().allLines();
  EXPECT_EQ(daemon->terminate(), 0);

  options.publicKey = {1, 2, 3};
  options.entitled = false;
  options.device.set("CountryCoed", "DE");
  daemon = std::make_unique<DaemonProcess>(options);
  std::ofstream(daemon->environment()["ORVANTA_FRAMEWORK"] + "/framework.plist")
      << "<plist><dict><key>vresion</key><string>8.0.0</string></dict></plist>";
  fs::create_directory(daemon->configurationDirectory() + "/entitlements.d");
  std::ofstream(daemon->configurationDirectory() + "/entitlements.d/a.plist")
      << "<plist><dict><key>usr</key><string>root</string></dict></plist>";
  std::ofstream(daemon->configurationDirectory() + "/entitlements.d/b.plist")
      << "<plist><dict><key>user</key><integer>0</integer><key>entitlements</key><dict>"
         "<key>com.kovalt.private.orvantd</key><true/></dict></dict></plist>";
  ASSERT_TRUE(platform::UserDefaults(daemon->stateDirectory(), "com.kovalt.orvanta").set("environment", 1));
  ASSERT_TRUE(daemon->start());
  for (int i = 0; i < 3; ++i) {
    ASSERT_TRUE(platform::connectToService(daemon->runtimeDirectory(), "com.kovalt.orvantad"));
  }
  ASSERT_TRUE(daemon->logged("does not have required orvanta entitlement. Closing connection...", 3));
  EXPECT_EQ(daemon->count("initWithSessionDelegate"), 0U) << "nothing is granted by default";
  for (const char* line : {
           "<4>DeviceProperties: unknown key CountryCoed in ",
           "/etc/device.plist, did you mean CountryCode?",
           "<4>bundleVersion: unknown key \"vresion\", did you mean \"version\"? in ",
           "<4>main: The framework bundle has no usable verification key, no storebag will be accepted: ",
           "/publicKey.der holds no RSA public key",
           "/etc/entitlements.d/a.plist grants nothing: unknown key \"usr\", did you mean \"user\"?",
           "<4>Entitlements: unknown key \"com.kovalt.private.orvantd\", did you mean \"com.kovalt.private.orvantad\"? "
           "in ",
           "<4>main: unknown key \"environment\", did you mean \"environmentType\"? in ",
           "<4>main: The entitlement com.kovalt.private.orvantad is granted to nobody in ",
       }) {
    EXPECT_EQ(daemon->count(line), 1U) << line;
  }
  EXPECT_EQ(daemon->count("<4>"), 7U) << daemon->process().allLines();
}

}  // namespace
}  // namespace orvanta::test
