#include "platform/Entitlements.h"

#include <gtest/gtest.h>

#include <string>

#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::test {
namespace {

using platform::Entitlements;
using platform::PeerIdentity;

const std::string kGranted = "com.example.may";

PeerIdentity somebody() {
  PeerIdentity peer;
  peer.pid = 1234;
  peer.uid = 4711;
  peer.gid = 4712;
  peer.groups = {1, 4713};  // 1 is "daemon" everywhere
  peer.label = "trusted_t";
  return peer;
}

std::string propertyList(const std::string& content) {
  return "<plist version=\"1.0\"><dict>" + content + "</dict></plist>";
}

std::string grant(const std::string& subject, const std::string& value = "<true/>") {
  return propertyList(subject + "<key>entitlements</key><dict><key>" + kGranted + "</key>" + value + "</dict>");
}

std::string text(const std::string& key, const std::string& value) {
  return "<key>" + key + "</key><string>" + value + "</string>";
}
std::string number(const std::string& key, const std::string& value) {
  return "<key>" + key + "</key><integer>" + value + "</integer>";
}

struct Row {
  const char* name;
  std::string content;
  bool granted;
  const char* logged = nullptr;  // part of the one line; null: none
};

class EntitlementsTest : public ::testing::TestWithParam<Row> {};

TEST_P(EntitlementsTest, ReadsOneFile) {
  const TemporaryDirectory directory;
  directory.write("grant.plist", GetParam().content);
  LogCapture log;
  Entitlements entitlements(directory.path());
  EXPECT_EQ(entitlements.holds(somebody(), kGranted), GetParam().granted);
  EXPECT_FALSE(entitlements.holds(somebody(), "com.example.mayNot"));
  if (GetParam().logged == nullptr) {
    EXPECT_TRUE(log.lines().empty()) << log.lines().front();
  } else {
    EXPECT_EQ(log.count(GetParam().logged), 1U);
    EXPECT_EQ(log.count("grant.plist"), 1U) << "the file is named";
    EXPECT_EQ(log.count("<4>"), 1U) << "once, however often it is read";
  }
}

INSTANTIATE_TEST_SUITE_P(
    Files, EntitlementsTest,
    ::testing::Values(
        Row{"userNumber", grant(number("user", "4711")), true},
        Row{"userNumberAsText", grant(text("user", "4711")), true},
        Row{"groupNumber", grant(number("group", "4712")), true},
        Row{"supplementaryGroup", grant(text("group", "4713")), true},
        Row{"groupName", grant(text("group", "daemon")), true}, Row{"label", grant(text("label", "trusted_t")), true},
        Row{"valueNumber", grant(number("user", "4711"), "<integer>2</integer>"), true},
        Row{"valueYes", grant(number("user", "4711"), "<string>YES</string>"), true},
        // What matches nobody here, or says no.
        Row{"otherUser", grant(number("user", "4712")), false},
        Row{"otherGroup", grant(number("group", "4711")), false},
        Row{"otherUserName", grant(text("user", "root")), false},
        Row{"otherLabel", grant(text("label", "trusted")), false},
        Row{"valueFalse", grant(number("user", "4711"), "<false/>"), false},
        Row{"valueZero", grant(number("user", "4711"), "<integer>0</integer>"), false},
        Row{"valueNo", grant(number("user", "4711"), "<string>NO</string>"), false},
        Row{"valueWithoutBooleanReading", grant(number("user", "4711"), "<array><true/></array>"), false},
        // What makes no sense.
        Row{"noPropertyList", "user: 4711", false, "grant.plist"},
        Row{"noDictionary", "<plist><array/></plist>", false, "no dictionary"},
        Row{"nobody", grant(""), false, "exactly one of"},
        Row{"twoSubjects", grant(number("user", "4711") + number("group", "4712")), false, "exactly one of"},
        Row{"misspelt", grant(number("users", "4711")), false, "unknown key \"users\", did you mean \"user\"?"},
        Row{"extraKey", grant(number("user", "4711") + text("expires", "never")), false, "unknown key \"expires\""},
        Row{"noEntitlements", propertyList(number("user", "4711")), false, "\"entitlements\" is missing"},
        Row{"entitlementsNoDictionary", propertyList(number("user", "4711") + "<key>entitlements</key><array/>"), false,
            "is no dictionary"},
        Row{"unknownUser", grant(text("user", "no-such-user-here")), false, "there is no \"no-such-user-here\""},
        Row{"unknownGroup", grant(text("group", "no-such-group-here")), false, "there is no"},
        Row{"negativeUser", grant(number("user", "-1")), false, "out of range"},
        Row{"userBeyond32Bits", grant(number("user", "4294971007")), false, "out of range"},
        Row{"userTextBeyond32Bits", grant(text("user", "4294971007")), false, "out of range"},
        Row{"nobodyAtAll", grant(number("user", "4294967295")), false, "out of range"},
        Row{"userTrue", grant("<key>user</key><true/>"), false, "neither a name nor a number"},
        Row{"userReal", grant("<key>user</key><real>4711</real>"), false, "neither a name nor a number"},
        Row{"userEmpty", grant(text("user", "")), false, "neither a name nor a number"},
        Row{"labelEmpty", grant(text("label", "")), false, "\"label\" is no text"}),
    [](const auto& info) { return std::string(info.param.name); });

TEST(EntitlementsDirectoryTest, AnyMatchingGrantThatReadsAsTrueCounts) {
  const TemporaryDirectory directory;
  Entitlements entitlements(directory.path());
  EXPECT_FALSE(entitlements.holds(somebody(), kGranted)) << "nothing is granted by default";
  directory.write("10-no.plist", grant(number("user", "4711"), "<false/>"));
  directory.write("20-broken.plist", "<plist>");
  directory.write("30-note.txt", grant(number("user", "4711")));
  directory.write(".40-half-written.plist", grant(number("user", "4711")));
  EXPECT_FALSE(entitlements.holds(somebody(), kGranted));
  EXPECT_FALSE(entitlements.isHeldByAnybody(kGranted));
  directory.write("45-another.plist", grant(number("user", "4712")));
  EXPECT_TRUE(entitlements.isHeldByAnybody(kGranted));
  EXPECT_FALSE(entitlements.isHeldByAnybody("com.example.mayNot"));
  EXPECT_FALSE(entitlements.holds(somebody(), kGranted));
  directory.write("50-yes.plist", grant(number("group", "4712")));
  EXPECT_TRUE(entitlements.holds(somebody(), kGranted)) << "read anew each time";
}

TEST(EntitlementsDirectoryTest, AnAbsentDirectoryGrantsNothing) {
  LogCapture log;
  EXPECT_FALSE(Entitlements("/nonexistent/entitlements.d").holds(somebody(), kGranted));
  EXPECT_EQ(log.count("<5>Entitlements: /nonexistent/entitlements.d cannot be read"), 1U);
}

// Without a security module every label is empty: that must not match anything.
TEST(EntitlementsDirectoryTest, APeerWithoutALabelMatchesNoLabel) {
  const TemporaryDirectory directory;
  directory.write("empty.plist", grant(text("label", "")));
  directory.write("other.plist", grant(text("label", "trusted_t")));
  PeerIdentity peer = somebody();
  peer.label.clear();
  EXPECT_FALSE(Entitlements(directory.path()).holds(peer, kGranted));
}

}  // namespace
}  // namespace orvanta::test
