#include "tools/collector/servers/StorebagServer.h"

#include <gmock/gmock.h>

#include <filesystem>

#include "platform/host/Digest.h"
#include "tests/support/Bytes.h"
#include "tests/tools/CollectorFixture.h"

namespace orvanta::collector {
namespace {

class StorebagServerTest : public CollectorFixture {
 protected:
  httplib::Result get(const std::string& name, httplib::Headers headers = {}) const {
    return http().Get("/storebags/" + name + "?version=8.0", headers);
  }
  // Returns the inner bag of a document and expects its signature to pass the daemon's own check with that key file.
  static Value verified(const std::string& document, const std::string& keyFile) {
    const auto content = openStorebag(test::bytesOf(document));
    EXPECT_TRUE(content) << content.error();
    if (!content) return {};
    const auto der = readFile(keyFile);
    const auto key = platform::RsaPublicKey::fromDer(*der);
    EXPECT_TRUE(key && key->verifySha1(platform::sha1(content->bag), content->signature));
    return content->inner;
  }
  static void setFileTime(const std::string& path, std::int64_t secondsSince1970) {
    const std::chrono::sys_time<std::chrono::seconds> time{std::chrono::seconds(secondsSince1970)};
    std::filesystem::last_write_time(path, std::chrono::file_clock::from_sys(time));
  }
};

TEST_F(StorebagServerTest, SignsTheDefaultBagWithItsPlacesFilledIn) {
  const auto answer = get("quillon");
  ASSERT_EQ(answer->status, 200);
  EXPECT_EQ(answer->get_header_value("Cache-Control"), "max-age=60") << "the bag's refresh_cycle";
  const Value inner = verified(answer->body, collector->publicKeyFile());
  for (const char* environment : {"development", "kovalt_internal", "seed", "release"}) {
    const Value& clients = at(at(at(inner, environment), "http_post"), "clients");
    for (std::size_t i = 0; i < clients.array()->size(); ++i) {
      EXPECT_EQ(at(at(clients, i), "post_url"), collector->eventsURL()) << environment;
    }
  }
  EXPECT_EQ(at(at(at(inner, "development"), "dashboard"), "port"), Value(int{collector->dashboardPort()}));
  EXPECT_THAT(answer->body, testing::Not(testing::HasSubstr("${")));
  EXPECT_EQ(verified(get("anything.else-1")->body, collector->publicKeyPkcs1File()), inner);
}

TEST_F(StorebagServerTest, AnswersNotModifiedByTheFilesTime) {
  const std::string file = directory / "storebag.json";
  setFileTime(file, 1'700'000'000);
  const auto first = get("x");
  EXPECT_EQ(first->get_header_value("Last-Modified"), "Tue, 14 Nov 2023 22:13:20 GMT");
  const auto since = [&](const std::string& date) { return get("x", {{"If-Modified-Since", date}}); };
  const auto unchanged = since("Tue, 14 Nov 2023 22:13:20 GMT");
  EXPECT_EQ(unchanged->status, 304);
  EXPECT_EQ(unchanged->body, "");
  EXPECT_EQ(unchanged->get_header_value("Cache-Control"), "max-age=60") << "what daemons then go by";
  EXPECT_EQ(since("Tue, 14 Nov 2023 22:13:19 GMT")->status, 200);
  EXPECT_EQ(since("yesterday")->status, 200);
  // Changed twice within one second, the unit of dates in HTTP.
  setFileTime(file, 1'700'000'100);
  const auto second = get("x")->get_header_value("Last-Modified");
  std::filesystem::last_write_time(file, std::filesystem::last_write_time(file) + std::chrono::milliseconds(1));
  const auto changed = since(second);
  EXPECT_EQ(changed->status, 200);
  EXPECT_NE(changed->get_header_value("Last-Modified"), second);
}

TEST_F(StorebagServerTest, PrefersTheBagsOwnFile) {
  const auto version = [&](const char* name) {
    return at(verified(get(name)->body, collector->publicKeyFile()), "version");
  };
  directory.write("brindle.json", R"({"version":"json"})");
  EXPECT_EQ(version("brindle"), "json");
  EXPECT_EQ(get("brindle")->get_header_value("Cache-Control"), "max-age=3600");
  collector->setBag(Dictionary{{"version", "held for all"}});
  EXPECT_EQ(version("halvora"), "held for all");
  ASSERT_EQ(http().Put("/control/bag?name=brindle", R"({"version":"put"})", "application/json")->status, 204);
  EXPECT_EQ(version("brindle"), "put");
  EXPECT_EQ(http().Delete("/control/bag")->status, 204);
  EXPECT_EQ(version("halvora"), "1.0.0");
}

TEST_F(StorebagServerTest, SaysWhatIsWrongWithABag) {
  directory.write("broken.json", "{\"version\": 1,");
  directory.write("list.json", "[1]");
  directory.write("nothing.json", R"({"version":null})");
  for (const char* name : {"broken", "list", "nothing"}) {
    const auto answer = get(name);
    EXPECT_EQ(answer->status, 500) << name;
    EXPECT_THAT(answer->body, testing::HasSubstr(std::string(name) + ".json")) << name;
  }
  for (const char* name : {"..%2Fx", ".hidden", "a%20b", "a%00b"}) EXPECT_EQ(get(name)->status, 404) << name;
}

}  // namespace
}  // namespace orvanta::collector
