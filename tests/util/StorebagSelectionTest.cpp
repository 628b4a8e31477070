#include <gmock/gmock.h>

#include "tests/util/StorebagFixture.h"

namespace orvanta {
namespace {

using platform::Dictionary;
using platform::Value;
using testing::HasSubstr;

class StorebagSelectionTest : public test::StorebagFixture {
 protected:
  platform::SharedDictionary select(std::int32_t clientType = 5) {
    return fetchStorebagForEnvironmentAndClientType(platform, clientType, fetch);
  }
  static Dictionary section(const char* mark) { return {{"dashboard", Dictionary{{"mark", mark}}}}; }
};

constexpr const char* kSeedMissing =
    "<4>fetchStorebagForEnvironmentAndClientType: Seed section is missing in the storebag.";

TEST_F(StorebagSelectionTest, takesTheEnvironmentsSection) {
  const Dictionary all{{"development", section("development")},
                       {"kovalt_internal", section("internal")},
                       {"seed", section("seed")},
                       {"release", section("release")}};
  const Dictionary releaseOnly{{"release", section("release")}};
  const Dictionary wrongType{{"seed", "text"}, {"release", section("release")}, {"development", 1}};
  const std::string notFound =
      "<3>fetchStorebagForEnvironmentAndClientType: Could not find storebag for client type 5 with ";
  struct Row {
    std::optional<int> environment;
    bool internalBuild;
    const Dictionary& bag;
    std::string mark;  // empty: none
    std::vector<std::string> lines;
  };
  const Row rows[] = {
      {1, false, all, "development", {}},
      {2, false, all, "internal", {}},
      {3, false, all, "seed", {}},
      {4, false, all, "release", {}},
      {{}, false, all, "seed", {}},
      {{}, true, all, "internal", {}},
      {7, false, all, "internal", {"<3>userDefaultsEnvironment: Invalid environment type 7"}},
      {3, false, releaseOnly, "release", {kSeedMissing}},
      {{}, false, wrongType, "release", {kSeedMissing}},
      {{}, false, Dictionary{}, "", {kSeedMissing, notFound + "release environment"}},
      {0, false, all, "", {notFound + "(null) environment"}},
      {1, false, releaseOnly, "", {notFound + "development environment"}},
      {1, false, wrongType, "", {notFound + "development environment"}},
      {2, true, releaseOnly, "", {notFound + "kovalt_internal environment"}},
      {4, false, Dictionary{}, "", {notFound + "release environment"}},
  };
  for (const Row& row : rows) {
    test::TestPlatform device;
    const auto der = signer.publicKeyDer(test::KeyLayout::subjectPublicKeyInfo);
    device.directory.write("share/publicKey.der", {reinterpret_cast<const char*>(der.data()), der.size()});
    if (row.internalBuild) device.device.release = "Internal";
    if (row.environment) {
      ASSERT_TRUE(device.get().defaults().set("environmentType", *row.environment));
    }
    device.http.answer = [&](const platform::HttpRequest&) {
      return test::ScriptedHttpClient::status(200, signer.document(row.bag));
    };
    log.clear();
    const auto chosen = fetchStorebagForEnvironmentAndClientType(device, 5, fetch);
    std::vector<std::string> problems;
    for (const auto& line : log.lines()) {
      if (line < "<5>") problems.push_back(line);
    }
    EXPECT_EQ(problems, row.lines);
    ASSERT_EQ(chosen != nullptr, !row.mark.empty()) << row.environment.value_or(-1);
    if (chosen) {
      EXPECT_EQ(*chosen, section(row.mark.c_str()));
    }
  }
}

TEST_F(StorebagSelectionTest, theBagsRefreshCycleOverridesTheServersMaxAge) {
  struct Row {
    std::optional<Value> refreshCycle;
    std::int32_t expected;
  };
  const Row rows[] = {
      {std::nullopt, 1200},
      {Value(100000), 86400},
      {Value(86400), 86400},
      {Value(600), 600},
      {Value(0), 0},
      {Value(-30), -30},
      {Value("600"), 600},
      {Value("soon"), 0},
      {Value(1LL << 40), 86400},
      {Value(-(1LL << 40)), std::numeric_limits<std::int32_t>::min()},
  };
  for (const Row& row : rows) {
    Dictionary bag{{"release", section("release")}};
    if (row.refreshCycle) bag.set("refresh_cycle", *row.refreshCycle);
    serve(signer.document(bag), {{"Cache-Control", "max-age=1200"}});
    log.clear();
    EXPECT_TRUE(select());
    EXPECT_EQ(fetch.maxAge, row.expected);
    EXPECT_EQ(log.contains("<6>fetchStorebagForEnvironmentAndClientType: Store bag override MaxAge=" +
                           std::to_string(row.expected)),
              row.refreshCycle.has_value());
  }
}

TEST_F(StorebagSelectionTest, readsTheVersion) {
  struct Row {
    std::optional<Value> version;
    std::string expected;
  };
  const Row rows[] = {{Value("7.1"), "7.1"}, {Value(12), "12"}, {std::nullopt, ""}};
  for (const Row& row : rows) {
    Dictionary bag{{"release", section("release")}};
    if (row.version) bag.set("version", *row.version);
    serve(signer.document(bag));
    fetch.version = "of the bag before";
    EXPECT_TRUE(select());
    EXPECT_EQ(fetch.version, row.expected);
  }
}

TEST_F(StorebagSelectionTest, refusesTypesWithoutAStorebagBeforeAnyRequest) {
  for (const std::int32_t clientType : {0, 1, 4, 19, -1}) {
    log.clear();
    EXPECT_FALSE(select(clientType));
    EXPECT_THAT(log.lines(),
                testing::ElementsAre("<3>fetchStorebagForEnvironmentAndClientType: Could not find storebag name for "
                                     "client type " +
                                     std::to_string(clientType)));
  }
  EXPECT_TRUE(platform.http.requests().empty());
}

TEST_F(StorebagSelectionTest, anUnchangedBagIsNoFailure) {
  serve("", {{"Last-Modified", "now"}, {"Cache-Control", "max-age=30"}}, 304);
  fetch.lastModified = "before";
  log.clear();
  EXPECT_FALSE(select());
  EXPECT_TRUE(fetch.notModified);
  EXPECT_EQ(fetch.maxAge, 30);
  EXPECT_EQ(log.count("<3>"), 0);
}

}  // namespace
}  // namespace orvanta
