#include "config/Storebag.h"

#include <gmock/gmock.h>

#include "platform/codec/PropertyList.h"
#include "tests/config/SignedStorebag.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta::test {
namespace {
using platform::HttpHeader;
using testing::ElementsAre;

// A device with the server's key installed, and a server that gives every request the same answer.
class StorebagFixture : public testing::Test {
 protected:
  StorebagFixture() { installKey(platform, signer.publicKeyDer(KeyLayout::subjectPublicKeyInfo)); }

  void serve(std::string body, std::vector<platform::HttpHeader> headers = {}, int status = 200) {
    platform::HttpResult result = ScriptedHttpClient::status(status, std::move(body));
    result.response->headers = std::move(headers);
    platform.http.answer = [result](const auto&) { return result; };
  }

  StorebagSigner signer;
  TestServices<ConfigServices> platform;
  StorebagFetch fetch;
  LogCapture log;
};

class StorebagFetchTest : public StorebagFixture {
 protected:
  SharedDictionary get(const std::string& name = "quillon") { return fetchStorebagWithName(platform, name, fetch); }
  const Dictionary bag{{"version", "7.1"}, {"release", Dictionary{{"dashboard", Dictionary{{"port", 5000}}}}}};
};

TEST(CacheControl, saysHowLongAnAnswerStaysFresh) {
  const std::pair<const char*, std::int32_t> rows[] = {
      {"max-age=600", 600},
      {"public, max-age=600, must-revalidate", 600},
      {"max-age=0", 0},
      {"max-age=soon", 0},
      {"max-age=", 0},
      {"max-age 30", 30},
      {"max-age = 600", 0},  // the piece behind the name is the empty one between "=" and the space before it
      {"max-age=99999999999", 2147483647},
      {"no-cache", 86400},
      {"", 86400},
      {"public,max-age=600", 86400},
      {"Max-Age=600", 86400},
  };
  for (const auto& [header, expected] : rows) EXPECT_EQ(maxAgeFromCacheControl(header), expected) << header;
  EXPECT_EQ(maxAgeFromCacheControl(std::nullopt), 86400);
}

TEST_F(StorebagFetchTest, asksTheServerForTheNameAndVersion) {
  platform.directory.write("share/framework.plist",
                           "<plist><dict><key>version</key><string>9.4.1</string></dict></plist>");
  ASSERT_TRUE(platform.get().defaults().set("orvanta_storebag_url", "http://127.0.0.1:9/bags"));
  for (const int status : {200, 203, 404, 500}) {  // which does not matter
    serve(signer.document(bag), {}, status);
    log.clear();
    const auto fetched = get();
    ASSERT_TRUE(fetched) << status;
    EXPECT_EQ(*fetched, bag);
    const auto request = platform.http.requests().back();
    EXPECT_EQ(request.method + " " + request.url, "GET http://127.0.0.1:9/bags/quillon?version=9.4.1");
    EXPECT_TRUE(request.headers.empty());
    EXPECT_EQ(request.timeout, std::chrono::seconds(15));
    EXPECT_THAT(log.lines(), ElementsAre("<7>fetchStorebagWithName: Storebag Server URL: " + request.url));
    EXPECT_EQ(fetch.maxAge, 86400);
    EXPECT_FALSE(fetch.notModified || fetch.lastModified);
  }
}

TEST_F(StorebagFetchTest, asksConditionallyOnceItHoldsAStamp) {
  const std::string monday = "Mon, 02 Mar 2026 10:00:00 GMT";
  serve(signer.document(bag), {{"last-modified", monday}, {"Cache-Control", "max-age=600"}});
  ASSERT_TRUE(get());
  EXPECT_EQ(fetch.maxAge, 600);
  EXPECT_EQ(fetch.lastModified, monday);
  EXPECT_TRUE(log.contains("<7>fetchStorebagWithName: New 'Last-Modified: " + monday + "' received"));

  serve("", {{"Last-Modified", "Tue"}, {"Cache-Control", "public"}, {"cache-control", "max-age=60"}}, 304);
  log.clear();
  EXPECT_FALSE(fetchStorebagForEnvironmentAndClientType(platform, 5, fetch)) << "but no failure";
  EXPECT_TRUE(fetch.notModified);
  EXPECT_EQ(fetch.maxAge, 60);
  EXPECT_EQ(fetch.lastModified, monday);
  const auto request = platform.http.requests().back();
  ASSERT_EQ(request.headers.size(), 1);
  EXPECT_EQ(request.headers[0].name + ": " + request.headers[0].value, "If-Modified-Since: " + monday);
  EXPECT_THAT(log.lines(),
              ElementsAre("<7>fetchStorebagWithName: Storebag Server URL: " + request.url,
                          "<7>fetchStorebagWithName: Adding 'Last-Modified: " + monday + "' to the header",
                          "<7>fetchStorebagWithName: storebag content has not changed. using its cached version"));
}

TEST_F(StorebagFetchTest, anEmptyAnswerIsUnchangedOnlyWithBothStamps) {
  const std::vector<HttpHeader> stamp{{"Last-Modified", "new"}};
  const std::string forged = StorebagSigner(SigningKey::generate().value()).document(bag);
  const struct {
    const char* what;
    std::optional<std::string> held;
    std::vector<HttpHeader> headers;
    std::string body;
    bool notModified;
    const char* heldAfter;
  } rows[] = {
      {"both", "old", stamp, "", true, "old"},
      {"nothing held", std::nullopt, stamp, "", false, "new"},
      {"no header", "old", {}, "", false, "old"},
      {"a body", "old", stamp, "no property list", false, "new"},
      {"a bag that cannot be verified", "old", stamp, forged, false, "new"},
  };
  for (const auto& row : rows) {
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
  platform.http.answer = [](const auto&) { return platform::HttpResult{std::nullopt, "Could not resolve host"}; };
  fetch.lastModified = "held";
  fetch.maxAge = 77;
  log.clear();
  EXPECT_FALSE(get("quillon"));
  EXPECT_EQ(log.lines().back(), "<6>fetchStorebagWithName: Error resolving with lookup server " +
                                    platform.http.requests().back().url +
                                    ", sendSynchronousRequest error Could not resolve host");
  const auto fallback = get("confluo");
  ASSERT_TRUE(fallback);
  EXPECT_TRUE(log.contains("<6>fetchStorebagWithName: Loading default storebag 'confluo'"));
  const Dictionary section{{"brisk", Dictionary{{"active", true}}}};
  EXPECT_EQ(*fallback, (Dictionary{{"kovalt_internal", section},
                                   {"development", section},
                                   {"release", section},
                                   {"version", "1.0.0-Confluo-Fallback"},
                                   {"refresh_cycle", 3600}}));
  EXPECT_EQ(fetch.lastModified, "held");
  EXPECT_EQ(fetch.maxAge, 77);
  EXPECT_FALSE(fetch.notModified);
  // A server that answers, however badly, is no reason to fall back.
  serve("", {}, 503);
  EXPECT_FALSE(get("confluo"));
}

TEST_F(StorebagFetchTest, everyFormOfDocumentBagAndKeyIsRead) {
  for (const auto layout : {KeyLayout::subjectPublicKeyInfo, KeyLayout::pkcs1}) {
    TestServices<ConfigServices> other;  // which has not kept a key yet
    installKey(other, signer.publicKeyDer(layout));
    for (const auto outer : {PlistForm::xml, PlistForm::binary}) {
      for (const auto inner : {PlistForm::xml, PlistForm::binary}) {
        other.http.answer = [&](const auto&) {
          return ScriptedHttpClient::status(200, signer.document(plistBytes(bag, inner), outer));
        };
        const auto fetched = fetchStorebagWithName(other, "quillon", fetch);
        ASSERT_TRUE(fetched);
        EXPECT_EQ(*fetched, bag);
      }
    }
  }
}

using StorebagSelectionTest = StorebagFixture;

Dictionary section(const char* mark) {
  return {{"dashboard", Dictionary{{"mark", mark}}}};
}

TEST_F(StorebagSelectionTest, takesTheEnvironmentsSection) {
  const Dictionary all{{"development", section("development")},
                       {"kovalt_internal", section("internal")},
                       {"seed", section("seed")},
                       {"release", section("release")}};
  const Dictionary releaseOnly{{"release", section("release")}};
  const Dictionary wrongType{{"seed", "text"}, {"release", section("release")}, {"development", 1}};
  const std::string seedMissing =
      "<4>fetchStorebagForEnvironmentAndClientType: Seed section is missing in the storebag.";
  const auto notFound = [](const std::string& environment) {
    return "<3>fetchStorebagForEnvironmentAndClientType: Could not find storebag for client type 5 with " +
           environment + " environment";
  };
  const struct {
    std::optional<int> environment;
    bool internalBuild;
    Dictionary bag;
    const char* mark;  // null: no section
    std::vector<std::string> lines = {};
  } rows[] = {
      {1, false, all, "development"},
      {3, false, all, "seed"},
      {{}, false, all, "seed"},
      {{}, true, all, "internal"},
      {3, false, releaseOnly, "release", {seedMissing}},
      {{}, false, wrongType, "release", {seedMissing}},
      {{}, false, {}, nullptr, {seedMissing, notFound("release")}},
      {0, false, all, nullptr, {notFound("(null)")}},
      {2, true, releaseOnly, nullptr, {notFound("kovalt_internal")}},
  };
  for (const auto& row : rows) {
    TestServices<ConfigServices> device;  // the environment is decided once
    installKey(device, signer.publicKeyDer(KeyLayout::subjectPublicKeyInfo));
    if (row.internalBuild) device.device.release = "Internal";
    if (row.environment) {
      ASSERT_TRUE(device.get().defaults().set("environmentType", *row.environment));
    }
    device.http.answer = [&](const auto&) { return ScriptedHttpClient::status(200, signer.document(row.bag)); };
    log.clear();
    const auto chosen = fetchStorebagForEnvironmentAndClientType(device, 5, fetch);
    auto problems = log.lines();
    std::erase_if(problems, [](const std::string& line) { return line > "<5>"; });
    EXPECT_EQ(problems, row.lines);
    ASSERT_EQ(chosen != nullptr, row.mark != nullptr) << row.environment.value_or(-1);
    EXPECT_TRUE(!chosen || *chosen == section(row.mark)) << row.environment.value_or(-1);
  }
}

TEST_F(StorebagSelectionTest, theBagsRefreshCycleOverridesTheServersMaxAge) {
  const std::pair<Value, std::int32_t> rows[] = {{nullptr, 1200},
                                                 {100000, 86400},
                                                 {600, 600},
                                                 {0, 0},
                                                 {"soon", 0},
                                                 {1LL << 40, 86400},
                                                 {-(1LL << 40), std::numeric_limits<std::int32_t>::min()}};
  for (const auto& [refreshCycle, expected] : rows) {
    Dictionary bag{{"release", section("release")}, {"version", 12}};
    if (!refreshCycle.isNull()) bag.set("refresh_cycle", refreshCycle);
    serve(signer.document(bag), {{"Cache-Control", "max-age=1200"}});
    log.clear();
    EXPECT_TRUE(fetchStorebagForEnvironmentAndClientType(platform, 5, fetch));
    EXPECT_EQ(fetch.maxAge, expected);
    EXPECT_EQ(fetch.version, "12");
    EXPECT_EQ(log.contains("<6>fetchStorebagForEnvironmentAndClientType: Store bag override MaxAge=" +
                           std::to_string(expected)),
              !refreshCycle.isNull());
  }
}

TEST_F(StorebagSelectionTest, refusesTypesWithoutAStorebagBeforeAnyRequest) {
  const std::string line = "<3>fetchStorebagForEnvironmentAndClientType: Could not find storebag name for client type ";
  for (const std::int32_t clientType : {4, 19, -1}) {
    log.clear();
    EXPECT_FALSE(fetchStorebagForEnvironmentAndClientType(platform, clientType, fetch));
    EXPECT_THAT(log.lines(), ElementsAre(line + std::to_string(clientType)));
  }
  EXPECT_TRUE(platform.http.requests().empty());
}

class StorebagVerificationTest : public StorebagFixture {
 protected:
  SharedDictionary open(std::string body) {
    serve(std::move(body));
    log.clear();
    return fetchStorebagWithName(platform, "quillon", fetch);
  }

  const Bytes bag = plistBytes(Dictionary{{"version", "7.1"}, {"refresh_cycle", 60}}, PlistForm::binary);
  const Bytes signature = signer.sign(bag);
};

constexpr const char* kMissing = "<3>fetchStorebagWithName: Signature is missing";
constexpr const char* kNotVerified = "<3>fetchStorebagWithName: Signature can not be verified, 0x";

TEST_F(StorebagVerificationTest, refusesAnyChangedBit) {
  ASSERT_TRUE(open(outerDocument(signature, bag)));
  const auto flipped = [](Bytes bytes, std::size_t bit) {
    bytes[bit / 8] = static_cast<std::uint8_t>(bytes[bit / 8] ^ (1U << (bit % 8)));
    return bytes;
  };
  for (std::size_t bit = 0; bit < signature.size() * 8; bit += 13) {
    EXPECT_FALSE(open(outerDocument(flipped(signature, bit), bag))) << "bit " << bit << " of the signature";
    EXPECT_EQ(log.count(kNotVerified), 1);
  }
  for (std::size_t bit = 0; bit < bag.size() * 8; bit += 5) {
    EXPECT_FALSE(open(outerDocument(signature, flipped(bag, bit)))) << "bit " << bit << " of the bag";
    EXPECT_EQ(log.count(kNotVerified), 1);
  }
}

TEST_F(StorebagVerificationTest, refusesDocumentsWithoutWhatItNeeds) {
  const std::string signatureText = platform::encodeBase64(signature), bagText = platform::encodeBase64(bag);
  const auto signedBag = [this](const Bytes& inner) {
    return Dictionary{{"signature", platform::encodeBase64(signer.sign(inner))},
                      {"bag", platform::encodeBase64(inner)}};
  };
  const std::pair<Value, bool> rows[] = {
      // whether an error line says that the signature is missing
      {Dictionary{{"bag", bagText}}, true},
      {Array{Value(signatureText), Value(bagText)}, true},
      {"signature", true},
      {Dictionary{{"signature", signatureText}}, false},
      {Dictionary{{"signature", "A"}, {"bag", bagText}}, false},
      {Dictionary{{"signature", platform::Data{signature}}, {"bag", bagText}}, false},
      {Dictionary{{"signature", signatureText}, {"bag", "A"}}, false},
      {Dictionary{{"signature", signatureText}, {"bag", 12}}, false},
      {signedBag({'n', 'o'}), false},
      {signedBag({}), false},
      {signedBag(plistBytes(Array{Value(1)}, PlistForm::xml)), false},
  };
  for (const auto& [document, missing] : rows) {
    const Bytes body = plistBytes(document, PlistForm::xml);
    EXPECT_FALSE(open({body.begin(), body.end()})) << document.description();
    EXPECT_EQ(log.count("<3>"), missing ? 1 : 0) << document.description();
    EXPECT_EQ(log.contains(kMissing), missing) << document.description();
  }
}

TEST_F(StorebagVerificationTest, needsAKeyAndTakesOneThatComesLater) {
  installKey(platform, {'n', 'o', ' ', 'k', 'e', 'y'});
  EXPECT_FALSE(open(outerDocument(signature, bag)));
  EXPECT_EQ(log.count("<3>"), 0);
  installKey(platform, signer.publicKeyDer(KeyLayout::pkcs1));
  EXPECT_TRUE(open(outerDocument(signature, bag)));
}

TEST_F(StorebagVerificationTest, saysWhyABodyIsNoPropertyList) {
  for (const char* body : {"", "<html><body>404</body></html>", "bplist00", "{\"signature\": \"x\"}"}) {
    EXPECT_FALSE(open(body)) << body;
    const auto lines = log.lines();
    ASSERT_EQ(lines.size(), 3) << body;
    EXPECT_THAT(lines[1], testing::StartsWith("<3>fetchStorebagWithName: propertyListWithData error ")) << body;
    EXPECT_EQ(lines[2], kMissing) << body;
  }
}

}  // namespace
}  // namespace orvanta::test
