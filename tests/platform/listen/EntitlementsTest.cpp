#include "platform/listen/Entitlements.h"

#include <gtest/gtest.h>

#include <string>

#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::test {
namespace {

using platform::Entitlements;
using platform::PeerIdentity;

const std::string kGranted = "com.example.may";

PeerIdentity samplePeer() {
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

const std::string kUser = number("user", "4711");

TEST(EntitlementsTest, ReadsOneFile) {
  const struct {
    bool granted;
    const char* logged;  // part of the one line; null when nothing is logged
    std::vector<std::string> contents;
  } rows[] = {
      {true,
       nullptr,
       {grant(kUser), grant(text("user", "4711")), grant(number("group", "4712")), grant(text("group", "4713")),
        grant(text("group", "daemon")), grant(text("label", "trusted_t")), grant(kUser, "<string>YES</string>")}},
      // Grants to other peers, or with a value of no.
      {false,
       nullptr,
       {grant(number("user", "4712")), grant(number("group", "4711")), grant(text("user", "root")),
        grant(text("label", "trusted")), grant(kUser, "<false/>"), grant(kUser, "<array><true/></array>")}},
      // Invalid grants.
      {false, "<4>", {"user: 4711"}},
      {false, "no dictionary", {"<plist><array/></plist>"}},
      {false, "exactly one of", {grant(""), grant(kUser + number("group", "4712"))}},
      {false, "unknown key \"users\", did you mean \"user\"?", {grant(number("users", "4711"))}},
      {false, "unknown key \"expires\"", {grant(kUser + text("expires", "never"))}},
      {false, "\"entitlements\" is missing", {propertyList(kUser)}},
      {false, "is no dictionary", {propertyList(kUser + "<key>entitlements</key><array/>")}},
      {false, "there is no \"no-such-", {grant(text("user", "no-such-user")), grant(text("group", "no-such-group"))}},
      {false,
       "out of range",
       {grant(number("user", "-1")), grant(number("user", "4294971007")), grant(text("user", "4294971007")),
        grant(number("user", "4294967295"))}},
      {false,
       "neither a name nor a number",
       {grant("<key>user</key><true/>"), grant("<key>user</key><real>4711</real>"), grant(text("user", ""))}},
      {false, "\"label\" is no text", {grant(text("label", ""))}},
  };
  for (const auto& row : rows) {
    for (const std::string& content : row.contents) {
      SCOPED_TRACE(content);
      const TemporaryDirectory directory;
      directory.write("grant.plist", content);
      LogCapture log;
      Entitlements entitlements(directory.path());
      EXPECT_EQ(entitlements.holds(samplePeer(), kGranted), row.granted);
      EXPECT_FALSE(entitlements.holds(samplePeer(), "com.example.mayNot"));
      EXPECT_EQ(log.lines().size(), row.logged == nullptr ? 0U : 1U) << "once, however often it is read";
      if (row.logged == nullptr) continue;
      EXPECT_EQ(log.count("<4>"), 1U);
      EXPECT_EQ(log.count(row.logged), 1U);
      EXPECT_EQ(log.count("grant.plist"), 1U) << "the file is named";
    }
  }
}

TEST(EntitlementsTest, AnyMatchingGrantThatReadsAsTrueCounts) {
  const TemporaryDirectory directory;
  Entitlements entitlements(directory.path());
  EXPECT_FALSE(entitlements.holds(samplePeer(), kGranted)) << "nothing is granted by default";
  directory.write("10-no.plist", grant(number("user", "4711"), "<false/>"));
  directory.write("20-broken.plist", "<plist>");
  directory.write("30-note.txt", grant(number("user", "4711")));
  directory.write(".40-half-written.plist", grant(number("user", "4711")));
  EXPECT_FALSE(entitlements.holds(samplePeer(), kGranted));
  EXPECT_FALSE(entitlements.isHeldByAnybody(kGranted));
  directory.write("45-another.plist", grant(number("user", "4712")));
  EXPECT_TRUE(entitlements.isHeldByAnybody(kGranted));
  EXPECT_FALSE(entitlements.isHeldByAnybody("com.example.mayNot"));
  EXPECT_FALSE(entitlements.holds(samplePeer(), kGranted));
  directory.write("50-yes.plist", grant(number("group", "4712")));
  EXPECT_TRUE(entitlements.holds(samplePeer(), kGranted)) << "read anew each time";
}

// Without a security module every label is empty: that must not match anything.
TEST(EntitlementsTest, APeerWithoutALabelMatchesNoLabel) {
  const TemporaryDirectory directory;
  directory.write("empty.plist", grant(text("label", "")));
  directory.write("other.plist", grant(text("label", "trusted_t")));
  PeerIdentity peer = samplePeer();
  peer.label.clear();
  EXPECT_FALSE(Entitlements(directory.path()).holds(peer, kGranted));
}

}  // namespace
}  // namespace orvanta::test
