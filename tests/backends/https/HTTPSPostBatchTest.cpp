#include <gtest/gtest.h>

#include "tests/backends/https/HTTPSFixture.h"

namespace orvanta::test {
namespace {

using HTTPSPostBatchTest = HTTPSFixture;

TEST_F(HTTPSPostBatchTest, ThresholdFlushesTheWholeBatch) {
  const LogCapture log;
  const auto backend = makeBackend(batching());
  const auto sendMany = [&](int count) {
    for (int i = 0; i < count; ++i) send(*backend, 3);
  };
  send(*backend, 4);
  sendMany(50);
  EXPECT_TRUE(requests().empty());
  sendMany(1);
  ASSERT_EQ(requests().size(), 1U);
  EXPECT_EQ(postedEvents(requests()[0]).size(), 51U) << "the other category's event too";
  EXPECT_EQ(log.count("<7>HTTPSPostBackend(batchEvent): Flushing all batched events as we reached event threshold for "
                      "method 3"),
            1U);
  sendMany(49);
  EXPECT_EQ(requests().size(), 1U) << "the triggering event began the next count";
  sendMany(1);
  ASSERT_EQ(requests().size(), 2U);
  EXPECT_EQ(postedEvents(requests()[1]).size(), 50U);
}

TEST_F(HTTPSPostBatchTest, AFlushThatSendsBeginsEveryCountAnew) {
  const auto backend = makeBackend(batching());
  for (int i = 0; i < 100; ++i) {
    if (i == 50) flush(*backend);
    send(*backend, 3);
    send(*backend, 4);
  }
  EXPECT_EQ(requests().size(), 1U);
}

// A relabelling between the moment when an event reads its identifier and the moment when it is batched.
TEST_F(HTTPSPostBatchTest, ARelabellingReachesTheEventThatIsBeingMade) {
  const auto fields = SessionFields::of(defaultIdentity(), false);
  const auto event = [&] { return EventRecord(fields, {}, "own", 0); };
  EventBatch batch;
  batch.append(event(), 1, 0, batch.labels());
  const std::uint64_t seen = batch.labels();
  batch.relabel("new");
  batch.append(event(), 1, 0, seen);
  batch.append(event(), 1, 0, batch.labels());
  EventBatch::Events events = batch.take();
  ASSERT_EQ(events.records.size(), 3U);
  EXPECT_EQ(events.relabelledCount, 2U);
  EXPECT_EQ(events.sessionID, "new");

  // With the earlier events taken out meanwhile, and no identifier any more.
  batch.append(event(), 1, 0, batch.labels());
  const std::uint64_t before = batch.labels();
  batch.relabel(std::nullopt);
  batch.take();
  batch.append(event(), 1, 0, before);
  events = batch.take();
  EXPECT_EQ(events.relabelledCount, 1U);
  EXPECT_EQ(events.sessionID, std::nullopt);
  EXPECT_TRUE(events.overlayFor(0).relabelled);
}

TEST_F(HTTPSPostBatchTest, ThresholdsFromTheStorebag) {
  const std::pair<Value, std::size_t> rows[] = {{-5, 2}, {1, 3}, {nullptr, 2}};
  for (const auto& [threshold, firstPostAt] : rows) {
    platform.http.clear();
    const auto backend = makeBackend(batching({{"event_threshold", threshold}}));
    std::size_t sent = 0;
    // A negative threshold is passed by the empty batch already: nothing to flush then.
    for (; requests().empty() && sent < 10; ++sent) send(*backend, 3);
    ASSERT_EQ(sent, firstPostAt) << threshold.description();
    EXPECT_EQ(postedEvents(requests()[0]).size(), sent - 1) << threshold.description();
  }
}

TEST_F(HTTPSPostBatchTest, AThresholdFlushThatDropsKeepsOtherCounts) {
  const auto backend = makeBackend(batching({{"event_threshold", 1}}));
  backend->setState(kBackendWaiting);
  // The last drops the batch; category 3 counts 1, category 4 still 2.
  for (const std::uint16_t category : {4, 4, 3, 3, 3}) send(*backend, category);
  backend->setState(kBackendEnabled);
  send(*backend, 3);
  send(*backend, 4);  // beyond its count: flushes those of category 3
  EXPECT_EQ(categories(), (Posts{"3 3"}));
}

TEST_F(HTTPSPostBatchTest, CategoriesAreCountedAsTheRecordNamesThem) {
  Setup setup = batching({{"event_threshold", 1}});
  setup.userInfo = shared({{"_method", 7}});
  const auto backend = makeBackend(setup);
  send(*backend, 1);
  send(*backend, 2);
  EXPECT_TRUE(requests().empty());
  send(*backend, 3);
  EXPECT_EQ(categories(), (Posts{"7 7"}));
}

TEST_F(HTTPSPostBatchTest, ABatchIsBoundedInBytes) {
  const LogCapture log;
  const auto payload = shared({{"filler", std::string(6U << 20U, 'x')}});
  const auto backend = makeBackend(batching());
  for (const std::uint16_t category : {1, 2, 3}) {
    EXPECT_TRUE(requests().empty());
    send(*backend, category, 0, payload);
  }
  EXPECT_EQ(categories(), (Posts{"1 2"}));
  // Where a flush must keep the batch it is dropped.
  const auto kept = makeBackend(requiring({}, true));
  kept->setUserInfoDict(nullptr);
  for (const std::uint16_t category : {10, 11, 12}) send(*kept, category, 0, payload);
  EXPECT_TRUE(log.contains("<4>HTTPSPostBackend(batchEvent): Dropping all batched events as they take"));
  kept->setUserInfoDict(shared({}));
  flush(*kept);
  EXPECT_EQ(categories(), (Posts{"1 2", "12"}));
}

TEST_F(HTTPSPostBatchTest, Correlation) {
  const auto own = shared({{"_sessionID", "payload's"}});
  const auto backend = makeBackend(batching());
  send(*backend, 1);
  send(*backend, 2, 0, own);
  backend->setCorrelatedSessionID("root.own");
  send(*backend, 3);
  flush(*backend);

  send(*backend, 1);
  backend->setCorrelatedSessionID("a");
  send(*backend, 2);
  backend->setCorrelatedSessionID(std::nullopt);
  send(*backend, 3, 0, own);
  flush(*backend);

  // Numbers give way in waiting events and return in later ones; user info that names the key has the last word.
  Setup setup = batching();
  setup.identity.clientType = 7;
  const auto numeric = makeBackend(setup);
  send(*numeric, 1);
  numeric->setCorrelatedSessionID("b");
  send(*numeric, 2);
  flush(*numeric);
  numeric->setUserInfoDict(shared({{"_sessionID", "info"}}));
  send(*numeric, 1);
  numeric->setCorrelatedSessionID("c");
  flush(*numeric);
  EXPECT_EQ(fields("_sessionID"), (Posts{"root.own root.own root.own", "none none payload's", "b 77", "info"}));
}

}  // namespace
}  // namespace orvanta::test
