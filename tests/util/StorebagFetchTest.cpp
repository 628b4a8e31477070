#include <gmock/gmock.h>

#include "tests/util/StorebagFixture.h"

namespace orvanta {
namespace {

using platform::Dictionary;
using platform::HttpHeader;
using test::Bytes;
using test::KeyLayout;
using test::PlistForm;
using testing::ElementsAre;

class StorebagFetchTest : public test::StorebagFixture {
 protected:
  platform::SharedDictionary get(const std::string& name = "quillon") {
    return fetchStorebagWithName(platform, name, fetch);
  }
  const Dictionary bag{{"version", "7.1"}, {"release", Dictionary{{"dashboard", Dictionary{{"port", 5000}}}}}};
};

TEST(CacheControl, saysHowLongAnAnswerStaysFresh) {
  struct Row {
    std::optional<std::string_view> header;
    std::int32_t expected;
  };
  const Row rows[] = {
      {"max-age=600", 600},
      {"public, max-age=600, must-revalidate", 600},
      {"max-age=600,public", 600},
      {"max-age=0", 0},
      {"max-age=-5", -5},
      {"max-age=soon", 0},
      {"max-age=", 0},
      {"max-age=12h", 12},
      {"max-age 30", 30},
      {"max-age = 600", 0},  // the piece behind the name is the empty one between "=" and the space before it
      {"max-age=99999999999", 2147483647},
      {"max-age=1 max-age=2", 1},
      {"no-cache", 86400},
      {"", 86400},
      {"public, max-age", 86400},
      {"public,max-age=600", 86400},
      {"s-max-age=600", 86400},
      {"Max-Age=600", 86400},
      {std::nullopt, 86400},
  };
  for (const Row& row : rows)
    EXPECT_EQ(maxAgeFromCacheControl(row.header), row.expected) << row.header.value_or("none");
}

TEST_F(StorebagFetchTest, asksTheServerForTheNameAndVersion) {
  platform.directory.write("share/framework.plist",
                           "<plist version=\"1.0\"><dict><key>version</key><string>9.4.1</string></dict></plist>");
  ASSERT_TRUE(platform.get().defaults().set("orvanta_storebag_url", "http://127.0.0.1:9/bags"));
  serve(signer.document(bag));
  log.clear();
  const auto fetched = get();
  ASSERT_TRUE(fetched);
  EXPECT_EQ(*fetched, bag);
  const auto requests = platform.http.requests();
  ASSERT_EQ(requests.size(), 1);
  EXPECT_EQ(requests[0].method, "GET");
  EXPECT_EQ(requests[0].url, "http://127.0.0.1:9/bags/quillon?version=9.4.1");
  EXPECT_TRUE(requests[0].headers.empty());
  EXPECT_EQ(requests[0].timeout, std::chrono::seconds(15));
  EXPECT_THAT(
      log.lines(),
      ElementsAre("<7>fetchStorebagWithName: Storebag Server URL: http://127.0.0.1:9/bags/quillon?version=9.4.1"));
  EXPECT_EQ(fetch.maxAge, 86400);
  EXPECT_FALSE(fetch.notModified);
  EXPECT_FALSE(fetch.lastModified);
}

TEST(StorebagServer, isTheOverrideOrFollowsTheBuildOnce) {
  struct Row {
    std::optional<std::string> setting;
    std::optional<std::string> releaseType;
    std::string expected;
  };
  const Row rows[] = {
      {std::nullopt, std::nullopt, "https://bags.kovalt.com/bags/tamrel"},
      {std::nullopt, "Internal", "https://internal-bags.kovalt.com/storebags/tamrel"},
      {"http://127.0.0.1:8080/x", "Internal", "http://127.0.0.1:8080/x"},
      {"http://127.0.0.1:8080/x", std::nullopt, "http://127.0.0.1:8080/x"},
  };
  for (const Row& row : rows) {
    test::TestPlatform platform;
    platform.device.release = row.releaseType;
    if (row.setting) {
      ASSERT_TRUE(platform.get().defaults().set("orvanta_storebag_url", *row.setting));
    }
    EXPECT_EQ(storebagServerURL(platform), row.expected);
    ASSERT_TRUE(platform.get().defaults().set("orvanta_storebag_url", "http://other.kovalt.com"));
    EXPECT_EQ(storebagServerURL(platform), row.expected) << "asked again";
    EXPECT_EQ(userDefaultStringForKey(platform, "orvanta_storebag_url"), "http://other.kovalt.com");
    EXPECT_EQ(userDefaultStringForKey(platform, "forceEventLogging"), std::nullopt);
  }
}

TEST_F(StorebagFetchTest, asksConditionallyOnceItHoldsAStamp) {
  serve(signer.document(bag), {{"last-modified", "Mon, 02 Mar 2026 10:00:00 GMT"}, {"Cache-Control", "max-age=600"}});
  ASSERT_TRUE(get());
  EXPECT_EQ(fetch.maxAge, 600);
  EXPECT_EQ(fetch.lastModified, "Mon, 02 Mar 2026 10:00:00 GMT");
  EXPECT_TRUE(log.contains("<7>fetchStorebagWithName: New 'Last-Modified: Mon, 02 Mar 2026 10:00:00 GMT' received"));

  serve("",
        {{"Last-Modified", "Tue, 03 Mar 2026 10:00:00 GMT"},
         {"Cache-Control", "public"},
         {"cache-control", "max-age=60"}},
        304);
  log.clear();
  EXPECT_FALSE(get());
  EXPECT_TRUE(fetch.notModified);
  EXPECT_EQ(fetch.maxAge, 60);
  EXPECT_EQ(fetch.lastModified, "Mon, 02 Mar 2026 10:00:00 GMT");
  const auto requests = platform.http.requests();
  ASSERT_EQ(requests.size(), 2);
  ASSERT_EQ(requests[1].headers.size(), 1);
  EXPECT_EQ(requests[1].headers[0].name, "If-Modified-Since");
  EXPECT_EQ(requests[1].headers[0].value, "Mon, 02 Mar 2026 10:00:00 GMT");
  EXPECT_THAT(
      log.lines(),
      ElementsAre("<7>fetchStorebagWithName: Storebag Server URL: " + requests[1].url,
                  "<7>fetchStorebagWithName: Adding 'Last-Modified: Mon, 02 Mar 2026 10:00:00 GMT' to the header",
                  "<7>fetchStorebagWithName: storebag content has not changed. using its cached version"));
}

TEST_F(StorebagFetchTest, anEmptyAnswerIsUnchangedOnlyWithBothStamps) {
  struct Row {
    std::string what;
    std::optional<std::string> held;
    std::vector<HttpHeader> headers;
    std::string body;
    bool notModified;
    std::optional<std::string> heldAfter;
  };
  const Row rows[] = {
      {"both", "old", {{"Last-Modified", "new"}}, "", true, "old"},
      {"nothing held", std::nullopt, {{"Last-Modified", "new"}}, "", false, "new"},
      {"no header", "old", {}, "", false, "old"},
      {"a body", "old", {{"Last-Modified", "new"}}, "no property list", false, "new"},
      {"a bag that cannot be verified",
       "old",
       {{"Last-Modified", "new"}},
       test::StorebagSigner("stranger").document(bag),
       false,
       "new"},
  };
  for (const Row& row : rows) {
    fetch = {};
    fetch.lastModified = row.held;
    serve(row.body, row.headers);
    log.clear();
    EXPECT_FALSE(get()) << row.what;
    EXPECT_EQ(fetch.notModified, row.notModified) << row.what;
    EXPECT_EQ(fetch.lastModified, row.heldAfter) << row.what;
    EXPECT_EQ(log.contains("<3>"), !row.notModified) << row.what;
  }
}

TEST_F(StorebagFetchTest, withoutAServerOnlyTheConferencingClientGetsABag) {
  failTransport("Could not resolve host");
  fetch.lastModified = "held";
  fetch.maxAge = 77;
  const std::string url = storebagServerURL(platform);
  log.clear();
  EXPECT_FALSE(get("quillon"));
  EXPECT_THAT(log.lines(),
              ElementsAre("<7>fetchStorebagWithName: Storebag Server URL: " + url + "/quillon?version=8.0",
                          "<7>fetchStorebagWithName: Adding 'Last-Modified: held' to the header",
                          "<6>fetchStorebagWithName: Error resolving with lookup server " + url +
                              "/quillon?version=8.0, sendSynchronousRequest error Could not resolve host"));
  const auto fallback = get("confluo");
  ASSERT_TRUE(fallback);
  EXPECT_TRUE(log.contains("<6>fetchStorebagWithName: Loading default storebag 'confluo'"));
  const Dictionary section{{"brisk", Dictionary{{"active", true}}}};
  const Dictionary expected{{"kovalt_internal", section},
                            {"development", section},
                            {"release", section},
                            {"version", "1.0.0-Confluo-Fallback"},
                            {"refresh_cycle", 3600}};
  EXPECT_EQ(*fallback, expected);
  EXPECT_EQ(fetch.lastModified, "held");
  EXPECT_EQ(fetch.maxAge, 77);
  EXPECT_FALSE(fetch.notModified);
  // A server that answers, however badly, is no reason to fall back.
  serve("", {}, 503);
  EXPECT_FALSE(get("confluo"));
}

TEST_F(StorebagFetchTest, theStatusCodeDoesNotMatter) {
  for (const int status : {200, 203, 404, 500}) {
    serve(signer.document(bag), {}, status);
    EXPECT_TRUE(get()) << status;
  }
}

TEST(StorebagForms, everyFormOfDocumentBagAndKeyIsRead) {
  const test::StorebagSigner signer;
  const Dictionary bag{{"version", "7.1"}};
  for (const auto layout : {KeyLayout::subjectPublicKeyInfo, KeyLayout::pkcs1}) {
    test::TestPlatform platform;
    const Bytes der = signer.publicKeyDer(layout);
    platform.directory.write("share/publicKey.der", {reinterpret_cast<const char*>(der.data()), der.size()});
    for (const auto outer : {PlistForm::xml, PlistForm::binary}) {
      for (const auto inner : {PlistForm::xml, PlistForm::binary}) {
        platform.http.answer = [&](const platform::HttpRequest&) {
          return test::ScriptedHttpClient::status(200, signer.document(test::plistBytes(bag, inner), outer));
        };
        StorebagFetch fetch;
        const auto fetched = fetchStorebagWithName(platform, "quillon", fetch);
        ASSERT_TRUE(fetched);
        EXPECT_EQ(*fetched, bag);
      }
    }
  }
}

}  // namespace
}  // namespace orvanta
