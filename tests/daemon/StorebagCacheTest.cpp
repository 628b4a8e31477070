#include "daemon/StorebagCache.h"

#include <gtest/gtest.h>

#include "tests/support/LogCapture.h"
#include "tests/support/TestClock.h"

namespace orvanta::test {
namespace {

class StorebagCacheTest : public ::testing::Test {
 protected:
  std::string ask(std::int32_t clientType = 5) {
    const auto found = cache.storebag(clientType);
    return found ? found->begin()->first : "none";
  }

  LogCapture log;
  TestClock clock;
  int fetches = 0;
  std::optional<std::string> sentStamp;
  // The server gives a bag called "first", no news, or nothing.
  enum { good, notModified, failure } answer = good;
  int maxAge = 100;
  StorebagCache cache{clock, [this](std::int32_t, StorebagFetch& fetch) -> SharedDictionary {
                        ++fetches;
                        sentStamp = fetch.lastModified;
                        fetch.maxAge = maxAge;
                        fetch.notModified = answer == notModified;
                        if (answer != good) return nullptr;
                        fetch.version = "v1";
                        fetch.lastModified = "Monday";
                        return std::make_shared<const Dictionary>(Dictionary{{"first", Dictionary{}}});
                      }};
};

TEST(StorebagFreshnessTest, FollowsTheTimingRules) {
  using enum StorebagFreshness;
  constexpr auto kGood = StorebagFetchState::successful;
  constexpr auto kBad = StorebagFetchState::failure;
  const std::tuple<StorebagFetchState, double, int, StorebagFreshness> rows[] = {
      // state, age, maximum, result
      {kGood, 0, 100, fresh},      {kGood, 99.9, 100, fresh}, {kGood, 100, 100, expired}, {kGood, -99, 100, fresh},
      {kGood, -100, 100, expired}, {kGood, 0, 0, expired},    {kGood, 0, -5, expired},    {kGood, 5000, 100, expired},
      {kBad, 0, 100000, waiting},  {kBad, 899.9, 0, waiting}, {kBad, 900, 0, expired},    {kBad, 900, 100000, expired},
      {kBad, -899, 0, waiting},    {kBad, -901, 0, expired},
  };
  for (const auto& [state, age, maxAge, expected] : rows) {
    StorebagCacheEntry entry;
    entry.storebagFetchTime = 1000;
    entry.storebagFetchState = state;
    entry.storebagMaxAge = maxAge;
    EXPECT_EQ(freshnessOf(entry, 1000 + age), expected) << age << " of " << maxAge;
  }
}

TEST_F(StorebagCacheTest, ClientTypesOfOneStorebagShareOneFetchUntilItExpires) {
  for (const int clientType : {7, 11, 13}) EXPECT_EQ(ask(clientType), "first");
  EXPECT_EQ(fetches, 1);
  EXPECT_TRUE(log.contains("storebagForSession: Cached storebag found for client type 11"));
  EXPECT_EQ(ask(5), "first");
  EXPECT_EQ(fetches, 2) << "another storebag is another entry";
  clock.advance(100);
  maxAge = 0;
  for (int i = 3; i <= 5; ++i) {
    EXPECT_EQ(ask(13), "first");
    EXPECT_EQ(fetches, i);
  }
}

TEST_F(StorebagCacheTest, AFailureKeepsTheLastGoodBagAndWaits900Seconds) {
  ask();
  clock.advance(100);
  answer = failure;
  maxAge = 86400;
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
  EXPECT_EQ(cache.version(5), std::nullopt);
  EXPECT_EQ(fetches, 0) << "a version is never fetched";
  answer = failure;
  EXPECT_EQ(ask(), "none");
  clock.advance(450);
  EXPECT_EQ(ask(), "none");
  EXPECT_EQ(fetches, 1);
  EXPECT_EQ(cache.version(5), std::nullopt);
}

TEST_F(StorebagCacheTest, UnchangedRenewsTheTimeAndKeepsTheBag) {
  ask();
  EXPECT_EQ(sentStamp, std::nullopt);
  clock.advance(200);
  answer = notModified;
  maxAge = 5000;
  EXPECT_EQ(ask(), "first");
  EXPECT_EQ(sentStamp, "Monday");
  EXPECT_FALSE(log.contains("Unable to fetch"));
  clock.advance(4999);  // longer than a failure would wait
  EXPECT_EQ(ask(), "first");
  EXPECT_EQ(fetches, 2);
}

}  // namespace
}  // namespace orvanta::test
