#include "backends/HTTPSPostBackend.h"

#include <gtest/gtest.h>

#include "platform/Json.h"
#include "tests/backends/HTTPSFixture.h"

namespace orvanta::test {
namespace {

class HTTPSPostBackendTest : public HTTPSFixture {};

TEST_F(HTTPSPostBackendTest, WhatASendDoesInEachState) {
  enum Outcome { dropped, batched, posted };
  struct Row {
    std::int32_t state;
    bool batchEvents;
    std::int32_t flag;
    bool hasUserInfo;
    Outcome outcome;
    std::int32_t stateAfter;
  };
  const Row rows[] = {
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
    const std::string what = "state " + std::to_string(row.state) + " batch " + std::to_string(row.batchEvents) +
                             " flag " + std::to_string(row.flag) + " info " + std::to_string(row.hasUserInfo);
    platform.http.clear();
    Setup setup;
    setup.identity.requireUserInfo = true;
    setup.userInfo = shared({{"clientName", "Mail"}});
    const auto backend = makeBackend(setup);
    backend->setBatchEvents(row.batchEvents);
    backend->setState(row.state);
    if (!row.hasUserInfo) backend->setUserInfoDict(nullptr);
    EXPECT_EQ(send(*backend, 5, row.flag), std::nullopt) << what;
    EXPECT_EQ(backend->state(), row.stateAfter) << what;
    EXPECT_EQ(requests().size(), row.outcome == posted ? 1U : 0U) << what;
    // What was batched is there to be flushed.
    backend->setState(kBackendEnabled);
    backend->setUserInfoDict(shared({{"clientName", "Mail"}}));
    flush(*backend);
    EXPECT_EQ(requests().size(), row.outcome == dropped ? 0U : 1U) << what;
  }
}

TEST_F(HTTPSPostBackendTest, FlushInEachState) {
  struct Row {
    const char* what;
    std::int32_t state;
    bool batched;
    bool hasUserInfo;
    const char* error;  // null: none
    std::size_t posts;
    bool stays;
  };
  const Row rows[] = {
      {"waiting", 0, true, true, "Nothing to flush", 0, false},
      {"disabled", 1, true, true, "Nothing to flush", 0, false},
      {"held", 3, true, true, "Nothing to flush", 0, false},
      {"enabled, empty", 2, false, true, "Nothing to flush", 0, false},
      {"disabled, empty", 1, false, true, "Nothing to flush", 0, false},
      {"no user info", 2, true, false, "Can not flush: userInfo is required", 0, true},
      {"no user info, empty", 2, false, false, "Nothing to flush", 0, false},
      {"enabled", 2, true, true, nullptr, 1, false},
  };
  for (const auto& row : rows) {
    platform.http.clear();
    Setup setup = batching();
    setup.identity.requireUserInfo = true;
    setup.userInfo = shared({{"clientName", "Mail"}});
    const auto backend = makeBackend(setup);
    if (row.batched) send(*backend, 5);
    backend->setState(row.state);
    if (!row.hasUserInfo) backend->setUserInfoDict(nullptr);
    const FlushAnswer answer = flush(*backend);
    EXPECT_EQ(answer.calls, 1) << row.what;
    EXPECT_EQ(answer.text, std::nullopt) << row.what;
    if (row.error == nullptr) {
      EXPECT_EQ(answer.error, std::nullopt) << row.what;
    } else {
      ASSERT_TRUE(answer.error) << row.what;
      EXPECT_EQ(*answer.error, makeOrvantaError(row.error, -1)) << row.what;
    }
    EXPECT_EQ(requests().size(), row.posts) << row.what;
    backend->setState(kBackendEnabled);
    backend->setUserInfoDict(setup.userInfo);
    EXPECT_EQ(flush(*backend).error.has_value(), !row.stays) << row.what;
  }
}

TEST_F(HTTPSPostBackendTest, RealtimeEventsForceAFlushFirst) {
  const LogCapture log;
  platform.device.consent = true;
  const auto backend = makeBackend(batching());
  for (int i = 1; i <= 3; ++i) EXPECT_EQ(send(*backend, 3), std::nullopt);
  const auto text = send(*backend, 9, 1, nullptr, 4);
  EXPECT_EQ(categories(), (Posts{"3 3 3", "9"}));
  const auto posted = requests();
  EXPECT_EQ(posted[0].url, "https://events.example/batch");
  EXPECT_EQ(headerOf(posted[0], "X-ORV-Event-Map"), "(absent)");
  EXPECT_EQ(posted[1].url, "https://events.example/realtime");
  EXPECT_EQ(headerOf(posted[1], "X-ORV-Event-Map"), "9 4");
  ASSERT_TRUE(text);
  // The texts are those of the two bodies.
  const std::string head = "Flushed events:\n";
  const std::string middle = "\nStandalone event:\n";
  ASSERT_EQ(text->substr(0, head.size()), head);
  const std::size_t cut = text->find(middle);
  ASSERT_NE(cut, std::string::npos);
  const auto flushed = platform::parseJson(text->substr(head.size(), cut - head.size()));
  const auto single = platform::parseJson(text->substr(cut + middle.size()));
  EXPECT_EQ(*flushed, *platform::parseJson(plainBody(posted[0])));
  EXPECT_EQ(*single, *platform::parseJson(plainBody(posted[1])));
  EXPECT_TRUE(
      log.contains("<7>HTTPSPostBackend(sendMessage): Got a realtime event and some events have already been "
                   "batched. Forcing Flush here to keep events in order."));
  EXPECT_TRUE(log.contains("<7>HTTPSPostBackend(sendMessage): realtime is 1"));
  EXPECT_TRUE(log.contains("<7>HTTPSPostBackend(sendMessage): Sending 2, 1, 0"));
  EXPECT_EQ(log.count("<7>HTTPSPostBackend(sendMessage): Batching 2, 1, 0"), 3U);
  EXPECT_EQ(log.count("<7>HTTPSPostBackend(flushMessagesWithCompletion): called"), 1U);
}

TEST_F(HTTPSPostBackendTest, OrderStaysThoughPostsAreCompressedElsewhere) {
  const auto backend = makeBackend(batching());
  std::vector<std::string> expected;
  for (std::uint16_t i = 0; i < 60; i += 2) {
    send(*backend, i, 0, shared({{"filler", std::string(200 * (60U - i), 'x')}}));
    send(*backend, i + 1, 1);
    expected.push_back(std::to_string(i));
    expected.push_back(std::to_string(i + 1));
  }
  EXPECT_EQ(categories(), expected);
}

TEST_F(HTTPSPostBackendTest, HeldEventsGoOutAfterAPromotion) {
  Setup setup;
  setup.identity.requireUserInfo = true;
  setup.userInfo = shared({});
  const auto backend = makeBackend(setup);
  backend->setState(kBackendSampledOut);
  send(*backend, 1);
  send(*backend, 2, 2);
  EXPECT_EQ(categories(), (Posts{"2"})) << "not realtime: the held event stays where it is";
  flush(*backend);
  EXPECT_EQ(categories(), (Posts{"2", "1"}));
}

TEST_F(HTTPSPostBackendTest, FlushLeavesOutWhatTheListsRefuse) {
  const LogCapture log;
  Dictionary section = openSection();
  section.set("event_whitelist", Array{1, 2, "3"});
  section.set("event_blacklist", Array{2});
  Setup setup = batching();
  setup.identity.requireUserInfo = true;
  setup.userInfo = shared({});
  setup.profile = profileOf({Value(section)});
  const auto backend = makeBackend(setup);
  for (const std::uint16_t category : {1, 2, 3, 4}) send(*backend, category);
  flush(*backend);
  EXPECT_EQ(categories(), (Posts{"1 3"}));
  EXPECT_TRUE(
      log.contains("<7>flushMessagesWithCompletion: Dropping event with category 2 as it is blacklisted for "
                   "backend http_post"));
  EXPECT_TRUE(
      log.contains("<7>flushMessagesWithCompletion: Dropping event with category 4 as it is not whitelisted for "
                   "backend http_post"));
  send(*backend, 2);
  send(*backend, 4);
  const FlushAnswer answer = flush(*backend);
  EXPECT_EQ(answer.calls, 1);
  EXPECT_EQ(answer.error, makeOrvantaError("Nothing to flush: batched events were completely filtered out", -1));
  EXPECT_EQ(flush(*backend).error, makeOrvantaError("Nothing to flush", -1)) << "the batch is gone";
  EXPECT_EQ(requests().size(), 1U);
}

TEST_F(HTTPSPostBackendTest, FlushMergesTheUserInfoOfItsMoment) {
  Setup setup = batching();
  setup.userInfo = shared({{"clientName", "Mail"}, {"tier", "old"}});
  const auto backend = makeBackend(setup);
  send(*backend, 1, 0, shared({{"tier", "payload"}}));
  backend->setUserInfoDict(shared({{"tier", "new"}, {"_status", 99}}));
  send(*backend, 2);
  flush(*backend);
  const Array events = postedEvents(requests().at(0));
  for (const Value& event : events) {
    EXPECT_EQ(event.dictionary()->find("tier")->description(), "new");
    EXPECT_EQ(event.dictionary()->find("_status")->integerValue(), 99);
  }
  EXPECT_TRUE(events[0].dictionary()->contains("clientName"));
  EXPECT_FALSE(events[1].dictionary()->contains("clientName"));
}

TEST_F(HTTPSPostBackendTest, SessionEndRecord) {
  const LogCapture log;
  const auto endRecord = [&](HTTPSPostBackend& backend, SharedDictionary payload) {
    platform.http.clear();
    send(backend, 0, 1, std::move(payload), 1);
    return *postedEvents(requests().at(0)).at(0).dictionary();
  };
  const auto plain = makeBackend({});
  Dictionary event = endRecord(*plain, shared({{"StorebagVersion", "1.2"}, {"Opt", "payload's"}}));
  EXPECT_EQ(event.find("StorebagVersion")->description(), "1.2");
  EXPECT_EQ(*event.find("Opt"), Value(0));
  EXPECT_EQ(*event.find("SamplingThreshold"), Value(-1));
  EXPECT_EQ(*event.find("OverrideSampling"), Value(-1));
  EXPECT_EQ(*event.find("Batch"), Value(0));
  EXPECT_EQ(log.count("<7>HTTPSPostBackend(sendMessage): Adding dnu type and sampling threshold to SESSION_TYPE_STOP "
                      "message dictionary"),
            1U);

  Dictionary section = openSection();
  section.set("sampling_threshold", 0.25);
  section.set("override_sampling", 0.75);
  Setup setup = batching();
  setup.identity.requireUserInfo = true;
  setup.userInfo = shared({});
  setup.profile = profileOf({Value(section)});
  setup.samplingFactor = 0.5;
  const auto held = makeBackend(setup);
  ASSERT_EQ(held->state(), kBackendSampledOut);
  held->setState(kBackendEnabled);
  held->setSamplingThreshold(0.125);  // as copied from a parent session
  event = endRecord(*held, shared({}));
  EXPECT_EQ(*event.find("Opt"), Value(1));
  EXPECT_EQ(event.find("SamplingThreshold")->doubleValue(), 0.125);
  EXPECT_EQ(event.find("OverrideSampling")->doubleValue(), 0.75);
  EXPECT_EQ(*event.find("Batch"), Value(1));

  event = endRecord(*plain, nullptr);
  EXPECT_FALSE(event.contains("Opt"));
  EXPECT_EQ(log.count("<3>HTTPSPostBackend(sendMessage): SESSION_TYPE_STOP message dictionary is nil"), 1U);
  platform.http.clear();
  send(*plain, 0, 0, shared({{"a", 1}}), 2);
  EXPECT_FALSE(postedEvents(requests().at(0)).at(0).dictionary()->contains("Opt")) << "type 2 ends nothing";
}

TEST_F(HTTPSPostBackendTest, WhoIsShownWhatWasSent) {
  struct Row {
    const char* what;
    bool consent;
    int overrideDnu;
    std::int64_t environment;
    const char* force;
    bool shown;
  };
  const Row rows[] = {
      {"consent", true, 0, 4, nullptr, true},
      {"no consent", false, 1, 4, nullptr, false},
      {"consent, overridden", true, 1, 4, nullptr, false},
      {"forced on development", false, 1, 1, "YES", true},
      {"forced on internal", true, 1, 2, "1", true},
      {"forced on seed", false, 1, 3, "true", false},
      {"forced on release", false, 1, 4, "YES", false},
      {"not forced on development", false, 1, 1, "NO", false},
      {"nonsense on development", false, 1, 1, "maybe", false},
      {"absent on development", false, 1, 1, nullptr, false},
  };
  for (const auto& row : rows) {
    TestPlatform own;  // the environment is decided once per platform
    own.device.consent = row.consent;
    ASSERT_TRUE(own.get().defaults().set("environmentType", row.environment).ok());
    if (row.force != nullptr) {
      ASSERT_TRUE(own.get().defaults().set("forceEventLogging", row.force).ok());
    }
    Dictionary section = openSection();
    section.set("override_dnu", row.overrideDnu);
    const auto backend = HTTPSPostBackend::create(own, "http_post", shared(profileOf({Value(section)})), "Parva");
    BackendIdentity identity = defaultIdentity();
    identity.requireUserInfo = true;
    backend->setIdentity(identity);
    backend->setUserInfoDict(shared({}));
    backend->setSamplingFactor(0);
    backend->updateState();
    ASSERT_EQ(backend->state(), kBackendEnabled) << row.what;
    EXPECT_EQ(send(*backend, 1).has_value(), row.shown) << row.what;
    EXPECT_TRUE(PendingPosts::of(own)->waitUntilHandedIn(kHangGuard));
  }
}

TEST_F(HTTPSPostBackendTest, AShownFlushFreezesTheState) {
  platform.device.consent = true;
  const auto frozenBy = [&](bool forced) {
    Setup setup = batching();
    const auto backend = makeBackend(setup);
    send(*backend, 1);
    if (forced) {
      send(*backend, 2, 1);
    } else {
      const FlushAnswer answer = flush(*backend);
      EXPECT_TRUE(answer.text);
      EXPECT_EQ(answer.error, std::nullopt);
    }
    settle();
    return backend;
  };
  for (const bool forced : {false, true}) {
    const auto backend = frozenBy(forced);
    BackendIdentity waiting = defaultIdentity();
    waiting.requireUserInfo = true;
    backend->setIdentity(waiting);  // an evaluation would now wait for user info
    backend->updateState();
    EXPECT_EQ(backend->state(), kBackendEnabled) << forced;
    // Others still set the state; an evaluation stores nothing over that.
    backend->setState(kBackendDisabled);
    backend->updateState();
    EXPECT_EQ(backend->state(), kBackendDisabled) << forced;
  }
}

TEST_F(HTTPSPostBackendTest, OtherSendsFreezeNothing) {
  const auto unfrozen = [&](HTTPSPostBackend& backend) {
    BackendIdentity waiting = defaultIdentity();
    waiting.requireUserInfo = true;
    backend.setIdentity(waiting);
    backend.updateState();
    return backend.state() == kBackendWaiting;
  };
  platform.device.consent = true;
  const auto direct = makeBackend({});
  ASSERT_TRUE(send(*direct, 1)) << "shown, but no flush";
  EXPECT_TRUE(unfrozen(*direct));
  platform.device.consent = false;
  const auto hidden = makeBackend(batching());
  send(*hidden, 1);
  flush(*hidden);
  EXPECT_TRUE(unfrozen(*hidden)) << "a flush, but not shown";
  settle();
}

TEST_F(HTTPSPostBackendTest, TimeZoneOfTheMoment) {
  const auto backend = makeBackend(batching());
  platform.device.offset = 3600;
  send(*backend, 1);
  platform.device.offset = -7200;
  send(*backend, 1);
  flush(*backend);
  const Array events = postedEvents(requests().at(0));
  EXPECT_EQ(*events[0].dictionary()->find("_timezoneOffset"), Value(3600));
  EXPECT_EQ(*events[1].dictionary()->find("_timezoneOffset"), Value(-7200));
  EXPECT_EQ(*events[0].dictionary()->find("_eventNumber"), Value(1));
  EXPECT_EQ(*events[1].dictionary()->find("_eventNumber"), Value(2));
}

}  // namespace
}  // namespace orvanta::test
