#include "daemon/StorebagCache.h"

#include <gtest/gtest.h>

#include "tests/support/LogCapture.h"
#include "tests/support/TestClock.h"

namespace orvanta::test {
namespace {

using platform::Dictionary;

class StorebagCacheTest : public ::testing::Test {
 protected:
  static platform::SharedDictionary bag(const char* name) {
    return std::make_shared<const Dictionary>(Dictionary{{name, Dictionary{}}});
  }
  std::string ask(std::int32_t clientType = 5) {
    const auto found = cache.storebag(clientType);
    return found ? found->begin()->first : "none";
  }

  LogCapture log;
  TestClock clock;
  int fetches = 0;
  std::optional<std::string> sentStamp;
  std::function<platform::SharedDictionary(StorebagFetch&)> server = [](StorebagFetch& fetch) {
    fetch.maxAge = 100;
    fetch.version = "v1";
    return bag("first");
  };
  StorebagCache cache{clock, [this](std::int32_t, StorebagFetch& fetch) {
                        ++fetches;
                        sentStamp = fetch.lastModified;
                        return server(fetch);
                      }};
};

TEST(StorebagFreshnessTest, FollowsTheTimingRules) {
  using enum StorebagFreshness;
  constexpr auto kGood = StorebagFetchState::successful;
  constexpr auto kBad = StorebagFetchState::failure;
  const struct {
    StorebagFetchState state;
    double age;
    int maxAge;
    StorebagFreshness expected;
  } rows[] = {
      {kGood, 0, 100, fresh},      {kGood, 99.9, 100, fresh}, {kGood, 100, 100, expired}, {kGood, -99, 100, fresh},
      {kGood, -100, 100, expired}, {kGood, 0, 0, expired},    {kGood, 0, -5, expired},    {kGood, 5000, 100, expired},
      {kBad, 0, 100000, waiting},  {kBad, 899.9, 0, waiting}, {kBad, 900, 0, expired},    {kBad, 900, 100000, expired},
      {kBad, -899, 0, waiting},    {kBad, -901, 0, expired},
  };
  for (const auto& row : rows) {
    StorebagCacheEntry entry;
    entry.storebagFetchTime = 1000;
    entry.storebagFetchState = row.state;
    entry.storebagMaxAge = row.maxAge;
    EXPECT_EQ(freshnessOf(entry, 1000 + row.age), row.expected) << row.age << " of " << row.maxAge;
  }
}

TEST_F(StorebagCacheTest, ClientTypesOfOneStorebagShareOneFetchUntilItExpires) {
  EXPECT_EQ(ask(7), "first");
  EXPECT_EQ(ask(11), "first");
  EXPECT_EQ(ask(13), "first");
  EXPECT_EQ(fetches, 1);
  EXPECT_TRUE(log.contains("storebagForSession: Cached storebag found for client type 11"));
  EXPECT_EQ(ask(5), "first");
  EXPECT_EQ(fetches, 2) << "another storebag is another entry";
  clock.advance(100);
  EXPECT_EQ(ask(13), "first");
  EXPECT_EQ(fetches, 3);
}

TEST_F(StorebagCacheTest, WithoutAMaxAgeEveryRequestFetches) {
  server = [](StorebagFetch& fetch) {
    fetch.maxAge = 0;
    return bag("b");
  };
  for (int i = 1; i <= 3; ++i) {
    ask();
    EXPECT_EQ(fetches, i);
  }
}

TEST_F(StorebagCacheTest, AFailureKeepsTheLastGoodBagAndWaits900Seconds) {
  ask();
  clock.advance(100);
  server = [](StorebagFetch& fetch) -> platform::SharedDictionary {
    fetch.maxAge = 86400;
    return nullptr;
  };
  EXPECT_EQ(ask(), "first");
  EXPECT_EQ(fetches, 2);
  EXPECT_TRUE(log.contains("<3>fetchAndCacheStorebag: Unable to fetch storebag for client type 5"));
  clock.advance(899);
  EXPECT_EQ(ask(), "first");
  EXPECT_EQ(fetches, 2);
  EXPECT_TRUE(
      log.contains("<6>storebagForSession: Not fetching storebag for client type 5 - must wait 900 seconds "
                   "between attempts"));
  clock.advance(1);
  EXPECT_EQ(ask(), "first");
  EXPECT_EQ(fetches, 3);
  EXPECT_EQ(cache.version(5), "v1");
}

TEST_F(StorebagCacheTest, AFirstFailureServesNothingFor900Seconds) {
  server = [](StorebagFetch&) -> platform::SharedDictionary { return nullptr; };
  EXPECT_EQ(ask(), "none");
  clock.advance(450);
  EXPECT_EQ(ask(), "none");
  EXPECT_EQ(fetches, 1);
  EXPECT_EQ(cache.version(5), std::nullopt);
}

TEST_F(StorebagCacheTest, UnchangedRenewsTheTimeAndKeepsTheBag) {
  server = [](StorebagFetch& fetch) {
    fetch.maxAge = 100;
    fetch.version = "v1";
    fetch.lastModified = "Monday";
    return bag("first");
  };
  ask();
  EXPECT_EQ(sentStamp, std::nullopt);
  clock.advance(200);
  server = [](StorebagFetch& fetch) -> platform::SharedDictionary {
    fetch.maxAge = 500;
    fetch.notModified = true;
    return nullptr;
  };
  EXPECT_EQ(ask(), "first");
  EXPECT_EQ(sentStamp, "Monday");
  EXPECT_FALSE(log.contains("Unable to fetch"));
  clock.advance(499);
  EXPECT_EQ(ask(), "first");
  EXPECT_EQ(fetches, 2);
}

TEST_F(StorebagCacheTest, AVersionIsNeverFetched) {
  EXPECT_EQ(cache.version(5), std::nullopt);
  EXPECT_EQ(fetches, 0);
}

}  // namespace
}  // namespace orvanta::test
