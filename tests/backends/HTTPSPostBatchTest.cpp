#include <gtest/gtest.h>

#include "tests/backends/HTTPSFixture.h"

namespace orvanta::test {
namespace {

class HTTPSPostBatchTest : public HTTPSFixture {};

TEST_F(HTTPSPostBatchTest, ThresholdFlushesTheWholeBatch) {
  const LogCapture log;
  const auto backend = makeBackend(batching());
  send(*backend, 4);
  for (int i = 0; i < 50; ++i) send(*backend, 3);
  EXPECT_TRUE(requests().empty());
  send(*backend, 3);
  EXPECT_EQ(categories().size(), 1U);
  EXPECT_EQ(postedEvents(requests()[0]).size(), 51U) << "the other category's event too";
  EXPECT_EQ(log.count("<7>HTTPSPostBackend(batchEvent): Flushing all batched events as we reached event threshold for "
                      "method 3"),
            1U);
  for (int i = 0; i < 49; ++i) send(*backend, 3);
  EXPECT_EQ(requests().size(), 1U) << "the triggering event began the next count";
  send(*backend, 3);
  EXPECT_EQ(requests().size(), 2U);
  EXPECT_EQ(postedEvents(requests()[1]).size(), 50U);
}

TEST_F(HTTPSPostBatchTest, AFlushThatSendsBeginsEveryCountAnew) {
  const auto backend = makeBackend(batching());
  for (int i = 0; i < 50; ++i) {
    send(*backend, 3);
    send(*backend, 4);
  }
  flush(*backend);
  ASSERT_EQ(requests().size(), 1U);
  for (int i = 0; i < 50; ++i) {
    send(*backend, 3);
    send(*backend, 4);
  }
  EXPECT_EQ(requests().size(), 1U);
}

// A relabelling between the moment when an event reads its identifier and the moment when it is batched.
TEST_F(HTTPSPostBatchTest, ARelabellingReachesTheEventThatIsBeingMade) {
  OrvantaBackend backend(platform, "http_post", shared({}), "Parva");
  backend.setIdentity(defaultIdentity());
  const auto fields = SessionFields::of(backend, false);
  const auto event = [&] { return EventRecord(fields, nullptr, "own", {}); };
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
  const std::pair<Value, std::size_t> rows[] = {{0, 2}, {-1, 2}, {-5, 2}, {1, 3}, {nullptr, 2}};
  for (const auto& [threshold, firstPostAt] : rows) {
    platform.http.clear();
    Setup setup = batching();
    Dictionary section = openSection();
    section.erase("event_threshold");
    if (!threshold.isNull()) section.set("event_threshold", threshold);
    setup.profile = profileOf({Value(section)});
    const auto backend = makeBackend(setup);
    std::size_t sent = 0;
    // A negative threshold is passed by the empty batch already: nothing to flush then.
    while (requests().empty() && sent < 10) {
      send(*backend, 3);
      ++sent;
    }
    EXPECT_EQ(sent, firstPostAt) << threshold.description();
    EXPECT_EQ(postedEvents(requests()[0]).size(), sent - 1) << threshold.description();
  }
}

TEST_F(HTTPSPostBatchTest, AThresholdFlushThatDropsKeepsOtherCounts) {
  Setup setup = batching();
  Dictionary section = openSection();
  section.set("event_threshold", 1);
  setup.profile = profileOf({Value(section)});
  const auto backend = makeBackend(setup);
  backend->setState(kBackendWaiting);
  send(*backend, 4);
  send(*backend, 4);
  send(*backend, 3);
  send(*backend, 3);
  send(*backend, 3);  // drops the batch; category 3 counts 1, category 4 still 2
  backend->setState(kBackendEnabled);
  send(*backend, 4);  // beyond its count: flushes the one of category 3
  EXPECT_EQ(categories(), (Posts{"3"}));
}

TEST_F(HTTPSPostBatchTest, CategoriesAreCountedAsTheRecordNamesThem) {
  Setup setup = batching();
  Dictionary section = openSection();
  section.set("event_threshold", 1);
  setup.profile = profileOf({Value(section)});
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
  const auto backend = makeBackend(batching());
  const auto payload = shared({{"filler", std::string(6U << 20U, 'x')}});
  send(*backend, 1, 0, payload);
  send(*backend, 2, 0, payload);
  EXPECT_TRUE(requests().empty());
  send(*backend, 3, 0, payload);
  EXPECT_EQ(categories(), (Posts{"1 2"}));
  // Where a flush must keep the batch it is dropped.
  Setup setup = batching();
  setup.identity.requireUserInfo = true;
  setup.userInfo = shared({});
  const auto kept = makeBackend(setup);
  kept->setUserInfoDict(nullptr);
  for (std::uint16_t i = 10; i < 13; ++i) send(*kept, i, 0, payload);
  EXPECT_TRUE(log.contains("<4>HTTPSPostBackend(batchEvent): Dropping all batched events as they take"));
  kept->setUserInfoDict(shared({}));
  flush(*kept);
  EXPECT_EQ(categories(), (Posts{"1 2", "12"}));
}

TEST_F(HTTPSPostBatchTest, Correlation) {
  const auto sessionIDs = [](const platform::HttpRequest& request) {
    std::vector<std::string> all;
    for (const Value& event : postedEvents(request)) {
      const Value* label = event.dictionary()->find("_sessionID");
      all.push_back(label == nullptr ? "(none)" : label->description());
    }
    return all;
  };
  using Labels = std::vector<std::string>;
  const auto backend = makeBackend(batching());
  send(*backend, 1);
  send(*backend, 2, 0, shared({{"_sessionID", "payload's"}}));
  backend->setCorrelatedSessionID("root.own");
  send(*backend, 3);
  flush(*backend);
  EXPECT_EQ(sessionIDs(requests().at(0)), (Labels{"root.own", "root.own", "root.own"}));

  send(*backend, 1);
  backend->setCorrelatedSessionID("a");
  send(*backend, 2);
  backend->setCorrelatedSessionID(std::nullopt);
  send(*backend, 3, 0, shared({{"_sessionID", "payload's"}}));
  flush(*backend);
  EXPECT_EQ(sessionIDs(requests().at(1)), (Labels{"(none)", "(none)", "payload's"}));

  // Numbers give way in waiting events and return in later ones; user info that names the key has the last word.
  Setup setup = batching();
  setup.identity.compType = 7;
  const auto numeric = makeBackend(setup);
  send(*numeric, 1);
  numeric->setCorrelatedSessionID("b");
  send(*numeric, 2);
  flush(*numeric);
  EXPECT_EQ(sessionIDs(requests().at(2)), (Labels{"b", "77"}));
  numeric->setUserInfoDict(shared({{"_sessionID", "info"}}));
  send(*numeric, 1);
  numeric->setCorrelatedSessionID("c");
  flush(*numeric);
  EXPECT_EQ(sessionIDs(requests().at(3)), (Labels{"info"}));
}

}  // namespace
}  // namespace orvanta::test
