#include "backends/https/HTTPSPostBackend.h"

#include <gtest/gtest.h>

#include "tests/backends/https/HTTPSFixture.h"

namespace orvanta::test {
namespace {

class HTTPSPostBackendTest : public HTTPSFixture {
 protected:
  // One that shows what it posts, or does not.
  static Setup showing(bool shown, bool batches = true) {
    return requiring({{"override_dnu", shown ? 0 : 1}}, batches);
  }
  // Returns whether an evaluation that would wait for user info changes nothing.
  static bool isFrozen(HTTPSPostBackend& backend) {
    backend.setUserInfoDict(nullptr);
    backend.updateState();
    return backend.state() != kBackendWaiting;
  }
};

TEST_F(HTTPSPostBackendTest, WhatASendDoesInEachState) {
  enum Outcome { dropped, batched, posted };
  const struct {
    std::int32_t state;
    bool batchEvents;
    std::int32_t flag;
    bool hasUserInfo;
    Outcome outcome;
    std::int32_t stateAfter;
  } rows[] = {
      {1, false, 0, true, dropped, 1}, {1, true, 1, true, dropped, 1},   {1, false, 2, true, dropped, 1},
      {1, false, 3, true, dropped, 1}, {0, false, 0, true, batched, 0},  {0, false, 1, true, batched, 0},
      {0, false, 2, true, batched, 0}, {0, false, 3, true, batched, 0},  {2, false, 0, true, posted, 2},
      {2, true, 0, true, batched, 2},  {2, true, 1, true, posted, 2},    {2, true, 2, true, batched, 2},
      {2, true, 3, true, posted, 2},   {2, true, 4, true, batched, 2},   {2, true, 5, true, batched, 2},
      {2, true, -1, true, batched, 2}, {2, false, 0, false, batched, 2}, {2, true, 1, false, batched, 2},
      {3, false, 0, true, batched, 3}, {3, false, 1, true, batched, 3},  {3, false, 2, true, posted, 2},
      {3, false, 3, true, posted, 2},  {3, true, 2, true, batched, 2},   {3, true, 3, true, posted, 2},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(testing::Message() << "state " << row.state << " batch " << row.batchEvents << " flag " << row.flag
                                    << " info " << row.hasUserInfo);
    platform.http.clear();
    const Setup setup = requiring({}, row.batchEvents);
    const auto backend = makeBackend(setup);
    backend->setState(static_cast<BackendState>(row.state));
    if (!row.hasUserInfo) backend->setUserInfoDict(nullptr);
    EXPECT_EQ(send(*backend, 5, row.flag), std::nullopt);
    EXPECT_EQ(backend->state(), row.stateAfter);
    EXPECT_EQ(requests().size(), row.outcome == posted ? 1U : 0U);
    // What was batched is there to be flushed.
    backend->setState(kBackendEnabled);
    backend->setUserInfoDict(setup.userInfo);
    flush(*backend);
    EXPECT_EQ(requests().size(), row.outcome == dropped ? 0U : 1U);
  }
}

TEST_F(HTTPSPostBackendTest, FlushInEachState) {
  const struct {
    const char* what;
    std::int32_t state;
    bool batched, hasUserInfo;
    const char* error;  // null: posted
    bool stays;
  } rows[] = {
      {"waiting", 0, true, true, "Nothing to flush", false},
      {"disabled", 1, true, true, "Nothing to flush", false},
      {"held", 3, true, true, "Nothing to flush", false},
      {"no user info", 2, true, false, "Can not flush: userInfo is required", true},
      {"no user info, empty", 2, false, false, "Nothing to flush", false},
      {"enabled", 2, true, true, nullptr, false},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.what);
    platform.http.clear();
    const Setup setup = requiring({}, true);
    const auto backend = makeBackend(setup);
    if (row.batched) send(*backend, 5);
    backend->setState(static_cast<BackendState>(row.state));
    if (!row.hasUserInfo) backend->setUserInfoDict(nullptr);
    const FlushAnswer answer = flush(*backend);
    EXPECT_EQ(answer.calls, 1);
    EXPECT_EQ(answer.text, std::nullopt);
    EXPECT_EQ(answer.error, row.error == nullptr ? std::nullopt : std::optional(makeOrvantaError(row.error, -1)));
    EXPECT_EQ(requests().size(), row.error == nullptr ? 1U : 0U);
    backend->setState(kBackendEnabled);
    backend->setUserInfoDict(setup.userInfo);
    EXPECT_EQ(flush(*backend).error.has_value(), !row.stays);
  }
}

TEST_F(HTTPSPostBackendTest, OrderStaysThoughPostsAreCompressedElsewhere) {
  const auto backend = makeBackend(batching());
  std::promise<void> release = holdCompressing();  // so that all wait for a thread
  Posts expected;
  for (std::uint16_t i = 0; i < 60; i += 2) {
    send(*backend, i, 0, shared({{"filler", std::string(std::size_t{10'000} * (60U - i), 'x')}}));
    send(*backend, i + 1, 1);
    expected.push_back(std::to_string(i));
    expected.push_back(std::to_string(i + 1));
  }
  release.set_value();
  EXPECT_EQ(categories(), expected);
}

TEST_F(HTTPSPostBackendTest, FlushLeavesOutWhatTheListsRefuse) {
  const LogCapture log;
  const auto backend =
      makeBackend(requiring({{"event_whitelist", Array{1, 2, "3"}}, {"event_blacklist", Array{2}}}, true));
  for (const std::uint16_t category : {1, 2, 3, 4}) send(*backend, category);
  flush(*backend);
  EXPECT_EQ(categories(), (Posts{"1 3"}));
  const std::string line = "<7>flushMessagesWithCompletion: Dropping event with category ";
  EXPECT_TRUE(log.contains(line + "2 as it is blacklisted for backend http_post"));
}

TEST_F(HTTPSPostBackendTest, SessionEndRecord) {
  const LogCapture log;
  const auto endRecord = [&](HTTPSPostBackend& backend, const SharedDictionary& payload, std::uint16_t respCode = 1) {
    platform.http.clear();
    send(backend, 0, 1, payload, respCode);
    return postedEvents(requests().at(0)).at(0);
  };
  const auto expect = [](const Dictionary& event, const Dictionary& expected) {
    for (const auto& [key, value] : expected) {
      ASSERT_TRUE(event.contains(key)) << key;
      EXPECT_EQ(*event.find(key), value) << key;
    }
  };
  const auto plain = makeBackend({});
  expect(endRecord(*plain, shared({{"StorebagVersion", "1.2"}, {"Opt", "payload's"}})),
         {{"StorebagVersion", "1.2"}, {"Opt", 0}, {"SamplingThreshold", -1}, {"OverrideSampling", -1}, {"Batch", 0}});
  EXPECT_FALSE(endRecord(*plain, nullptr).contains("Opt"));
  EXPECT_EQ(log.count("<3>HTTPSPostBackend(sendMessage): SESSION_TYPE_STOP message dictionary is nil"), 1U);
  EXPECT_FALSE(endRecord(*plain, shared({{"a", 1}}), 2).contains("Opt")) << "type 2 ends nothing";

  Setup setup = requiring({{"sampling_threshold", 0.25}, {"override_sampling", 0.75}}, true);
  setup.samplingFactor = 0.5;
  const auto held = makeBackend(setup);
  ASSERT_EQ(held->state(), kBackendHeld);
  held->setState(kBackendEnabled);
  held->setSamplingThreshold(0.125);  // as copied from a parent session
  expect(endRecord(*held, shared({})),
         {{"Opt", 1}, {"SamplingThreshold", 0.125}, {"OverrideSampling", 0.75}, {"Batch", 1}});
}

TEST_F(HTTPSPostBackendTest, WhoIsShownWhatWasSent) {
  const struct {
    const char* what;
    bool consent;
    int overrideDnu;
    std::int64_t environment;
    const char* force;
    bool shown;
  } rows[] = {
      {"consent", true, 0, 4, nullptr, true},
      {"no consent", false, 1, 4, nullptr, false},
      {"consent, overridden", true, 1, 4, nullptr, false},
      {"forced on development", false, 1, 1, "YES", true},
      {"forced on internal", true, 1, 2, "1", true},
      {"forced on seed", false, 1, 3, "true", false},
      {"forced on release", false, 1, 4, "YES", false},
      {"nonsense on development", false, 1, 1, "maybe", false},
  };
  for (const auto& row : rows) {
    TestBackends own;  // the environment is decided once per platform
    own.device.consent = row.consent;
    ASSERT_TRUE(own.get().defaults().set("environmentType", row.environment).ok());
    if (row.force != nullptr) {
      ASSERT_TRUE(own.get().defaults().set("forceEventLogging", row.force).ok());
    }
    const auto backend = makeBackend(requiring({{"override_dnu", row.overrideDnu}}), own);
    ASSERT_EQ(backend->state(), kBackendEnabled) << row.what;
    EXPECT_EQ(send(*backend, 1).has_value(), row.shown) << row.what;
    EXPECT_TRUE(own.services.pendingPosts->waitUntilSubmitted(kHangGuard));
  }
}

TEST_F(HTTPSPostBackendTest, OnlyAShownFlushFreezesTheState) {
  platform.device.consent = true;
  for (const bool shown : {true, false}) {
    const auto flushed = makeBackend(showing(shown));
    send(*flushed, 1);
    EXPECT_EQ(flush(*flushed).text.has_value(), shown);
    EXPECT_EQ(isFrozen(*flushed), shown);
  }
  const auto forced = makeBackend(showing(true));
  send(*forced, 1);
  send(*forced, 2, 1);
  EXPECT_TRUE(isFrozen(*forced));
  // Others still set the state; an evaluation stores nothing over that.
  forced->setState(kBackendDisabled);
  forced->updateState();
  EXPECT_EQ(forced->state(), kBackendDisabled);

  const auto direct = makeBackend(showing(true, false));
  ASSERT_TRUE(send(*direct, 1)) << "shown, but no flush";
  EXPECT_FALSE(isFrozen(*direct));
  settle();
}

TEST_F(HTTPSPostBackendTest, TimeZoneOfTheMoment) {
  const auto backend = makeBackend(batching());
  for (const int offset : {3600, -7200}) {
    platform.device.offset = offset;
    send(*backend, 1);
  }
  flush(*backend);
  EXPECT_EQ(fields("_timezoneOffset"), (Posts{"3600 -7200"}));
  EXPECT_EQ(fields("_eventNumber"), (Posts{"1 2"}));
}

}  // namespace
}  // namespace orvanta::test
