#include "platform/host/DeviceProperties.h"

#include <gmock/gmock.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <limits>

#include "platform/host/SystemFacts.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/Threads.h"

namespace orvanta::platform {
namespace {

using orvanta::test::LogCapture;
using orvanta::test::TemporaryDirectory;
using Text = std::optional<std::string>;

const std::string kMachineId = "0123456789abcdef0123456789abcdef\n";

std::string plist(const std::string& entries) {
  return "<plist><dict>" + entries + "</dict></plist>";
}

// The text read from each of these; nothing from the last ones.
using Texts = std::vector<std::pair<std::string, Text>>;

TEST(SystemFacts, OsRelease) {
  const std::string content =
      "# a comment\nNAME=\"A System\"\nVERSION_ID=\"12\"\n BUILD_ID=rolling \nQUOTED='a b'\nESCAPED=\"x\\\"y\"\n"
      "EMPTY=\"\"\nTWICE=1\nTWICE=2\nXVERSION_ID=9\nLAST=end";
  const Texts rows = {{"VERSION_ID", "12"}, {"BUILD_ID", "rolling"}, {"QUOTED", "a b"}, {"ESCAPED", "x\"y"},
                      {"TWICE", "2"},       {"LAST", "end"},         {"EMPTY", {}},     {"VERSION", {}}};
  for (const auto& [key, expected] : rows) EXPECT_EQ(osReleaseValue(content, key), expected) << key;
}

TEST(SystemFacts, CountryOfALocale) {
  const Texts rows = {
      {"de_DE.UTF-8", "DE"}, {"de_AT@euro", "AT"}, {"en_us", "US"}, {"C.UTF-8", {}}, {"", {}}, {"de", {}},
      {"es_419", {}},        {"de_DEU", {}}};
  for (const auto& [locale, expected] : rows) EXPECT_EQ(countryOfLocale(locale), expected) << locale;
}

TEST(SystemFacts, DerivedIdentifiers) {
  const Text first = deriveDeviceIdentifier(kMachineId, "app.one");
  ASSERT_TRUE(first);
  EXPECT_THAT(*first, testing::MatchesRegex("[0-9a-f]{40}"));
  EXPECT_EQ(first, deriveDeviceIdentifier("0123456789abcdef0123456789abcdef", "app.one"))
      << "the line end does not count";
  EXPECT_NE(first, deriveDeviceIdentifier(kMachineId, "app.two"));
  EXPECT_EQ(first->find("0123456789abcdef"), std::string::npos);
  for (const char* unusable : {"", "\n", "uninitialized\n", "00000000000000000000000000000000\n", "0123", "zz"}) {
    EXPECT_EQ(deriveDeviceIdentifier(unusable, "app.one"), std::nullopt) << unusable;
  }
}

class DevicePropertiesTest : public testing::Test {
 protected:
  LinuxDeviceProperties make() const { return {_configuration.path(), "app.test", _root.path()}; }
  void configure(const std::string& content) const { _configuration.replace("device.plist", content); }
  TemporaryDirectory _configuration, _root;
  LogCapture _log;
};

TEST_F(DevicePropertiesTest, FactsAreConfiguredOrStandInTheSystemsFilesOrAreUnknown) {
  const struct {
    Text (LinuxDeviceProperties::*get)() const;
    const char* key;
    Text board, machine;  // from a board's files, and with a machine's beside them
  } rows[] = {
      {&LinuxDeviceProperties::uniqueDeviceID, "UniqueDeviceID", deriveDeviceIdentifier(kMachineId, "app.test"),
       deriveDeviceIdentifier(kMachineId, "app.test")},
      {&LinuxDeviceProperties::productVersion, "ProductVersion", "11", "12"},
      {&LinuxDeviceProperties::buildVersion, "BuildVersion", "7", "b9"},
      {&LinuxDeviceProperties::hardwareModel, "HardwareModel", "Maker Board Rev 2", "Machine 9"},
      {&LinuxDeviceProperties::serialNumber, "SerialNumber", "SN77", "SN77"},  // a filler is not an answer
      {&LinuxDeviceProperties::productType, "ProductType", "maker,board", "Machine 9"},
      {&LinuxDeviceProperties::deviceName, "DeviceName", {}, "Machines"},
      {&LinuxDeviceProperties::releaseType, "ReleaseType", {}, {}},
  };
  const auto device = make();
  std::string entries;
  for (const auto& row : rows) {
    EXPECT_EQ((device.*row.get)(), std::nullopt) << row.key;
    entries += "<key>" + std::string(row.key) + "</key><string>my " + row.key + "</string>";
  }
  EXPECT_EQ(device.automaticTimeZone(), std::nullopt);
  EXPECT_FALSE(device.diagnosticsSubmissionAllowed());

  _root.write("usr/lib/os-release", "VERSION_ID=11\nIMAGE_VERSION=7\n");
  _root.write("etc/machine-id", kMachineId);
  _root.write("proc/device-tree/model", std::string("Maker Board Rev 2\0", 18));
  _root.write("proc/device-tree/compatible", std::string("maker,board\0maker,soc\0", 22));
  _root.write("proc/device-tree/serial-number", std::string("SN77\0", 5));
  for (const auto& row : rows) EXPECT_EQ((device.*row.get)(), row.board) << row.key;
  _root.write("etc/os-release", "VERSION_ID=12\nBUILD_ID=b9\n");
  _root.write("sys/class/dmi/id/product_name", " Machine 9  \n");
  _root.write("sys/class/dmi/id/product_serial", "Default string\n");
  _root.write("sys/class/dmi/id/product_family", "Machines");
  for (const auto& row : rows) EXPECT_EQ((device.*row.get)(), row.machine) << row.key;

  configure(plist(entries + "<key>CountryCode</key><string>FR</string><key>AutomaticTimeZone</key><false/>"));
  for (const auto& row : rows) EXPECT_EQ((device.*row.get)(), "my " + std::string(row.key));
  EXPECT_EQ(device.countryCode(), "FR");
  EXPECT_EQ(device.automaticTimeZone(), false);
  configure(plist(""));
  EXPECT_EQ(device.productVersion(), "12") << "read again";
  EXPECT_TRUE(_log.lines().empty());
}

TEST_F(DevicePropertiesTest, ConsentNeedsAnHonestTrue) {
  const auto device = make();
  for (const std::string answer : {"<true/>", "<false/>", "<string>YES</string>", "<integer>1</integer>", "<array/>"}) {
    configure(plist("<key>DiagnosticsSubmissionAllowed</key>" + answer));
    EXPECT_EQ(device.diagnosticsSubmissionAllowed(), answer == "<true/>") << answer;
  }
}

TEST_F(DevicePropertiesTest, SaysWhatItDoesNotUnderstand) {
  const auto device = make();
  configure(plist("<key>ProductVersoin</key><string>1</string><key>SerialNumber</key><integer>7</integer>"));
  EXPECT_EQ(device.serialNumber(), std::nullopt);
  EXPECT_EQ(_log.count("<4>DeviceProperties: unknown key ProductVersoin in " + (_configuration / "device.plist") +
                       ", did you mean ProductVersion?"),
            1U);
  EXPECT_EQ(_log.count("<4>DeviceProperties: SerialNumber is not a string"), 1U);
  configure("garbage");
  EXPECT_EQ(device.serialNumber(), std::nullopt);
  EXPECT_EQ(device.serialNumber(), std::nullopt);
  EXPECT_EQ(_log.count("<3>DeviceProperties: " + (_configuration / "device.plist") + " counts as empty"), 1U);
}

// Environment and system files belong to the whole process, so these run in a child.
template <class Body>
void inChild(Body body) {
  const pid_t child = ::fork();
  if (child == 0) ::_exit(body());
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFEXITED(status));
  if (WEXITSTATUS(status) == 77) GTEST_SKIP() << "no mount namespaces here";
  EXPECT_EQ(WEXITSTATUS(status), 0) << "the number of the check that failed";
}

TEST_F(DevicePropertiesTest, CountryFollowsTheLocaleVariables) {
  inChild([&] {
    for (const char* name : {"LC_ALL", "LC_ADDRESS", "LC_MONETARY", "LANG"}) ::unsetenv(name);
    if (make().countryCode()) return 1;
    ::setenv("LANG", "de_DE.UTF-8", 1);
    if (make().countryCode() != "DE") return 2;
    ::setenv("LC_MONETARY", "fr_FR.UTF-8", 1);
    ::setenv("LC_ALL", "", 1);
    if (make().countryCode() != "FR") return 4;
    ::setenv("LC_ALL", "C", 1);
    return make().countryCode() ? 5 : 0;
  });
}

TEST_F(DevicePropertiesTest, TimeZoneOffsetsOfAMoment) {
  inChild([&] {
    ::setenv("TZ", "CET-1CEST,M3.5.0,M10.5.0/3", 1);
    const auto device = make();
    if (device.timeZoneOffset(1'700'000'000) != 3600) return 1;  // November
    if (device.timeZoneOffset(1'690'000'000) != 7200) return 2;  // July
    if (device.timeZoneOffset(std::numeric_limits<double>::quiet_NaN()) != 0) return 4;
    if (device.timeZoneOffset(-1e300) != 0) return 6;
    ::setenv("TZ", "QQQ+3:30", 1);
    return device.timeZoneOffset(1'700'000'001) == -12600 ? 0 : 7;
  });
}

TEST_F(DevicePropertiesTest, TimeZoneFollowsTheSystemsFile) {
  inChild([&] {
    ::unsetenv("TZ");
    // A view of the file system of our own, in which /etc/localtime may change.
    if (::unshare(CLONE_NEWNS) != 0 || ::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) return 77;
    const auto device = make();
    const auto show = [](const char* zone) {
      return ::mount((std::string("/usr/share/zoneinfo/") + zone).c_str(), "/etc/localtime", nullptr, MS_BIND,
                     nullptr) == 0;
    };
    if (!show("Asia/Tokyo")) return 77;
    if (device.timeZoneOffset(1'700'000'000) != 9 * 3600) return 1;
    if (!show("Asia/Kolkata")) return 2;
    return device.timeZoneOffset(1'700'000'001) == 19800 ? 0 : 3;
  });
}

TEST_F(DevicePropertiesTest, SeveralThreadsAsk) {
  configure(plist("<key>SerialNumber</key><string>S0</string>"));
  const auto device = make();
  std::atomic<bool> done{false};
  orvanta::test::inThreads(4, [&](int thread) {
    for (int i = 0; thread == 0 && i < 50; ++i) {
      configure(plist("<key>SerialNumber</key><string>S" + std::to_string(i) + "</string>"));
    }
    if (thread == 0) done = true;
    while (!done) {
      EXPECT_EQ(device.serialNumber().value_or("none")[0], 'S');
      device.timeZoneOffset(1'700'000'000);
    }
  });
}

}  // namespace
}  // namespace orvanta::platform
