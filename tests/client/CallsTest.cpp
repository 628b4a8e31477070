// Operations on the wire, and the way back of their answers.

#include <tuple>

#include "interface/WireLimits.h"
#include "tests/client/ClientFixture.h"

namespace orvanta::test {
namespace {

using Calls = ClientFixture;

// The integration tests show the other calls to the real daemon.
TEST_F(Calls, goOutAsRequestsOrNotificationsWithAllTheirArguments) {
  const auto list = std::make_shared<const Array>(Array{"x", platform::Date{5}, platform::Data{{1, 2}}});
  session().setSessionInfo(shared({{"sessionID", 7}}), nullptr, list, true, {});
  const Frame notified = peer->next();
  EXPECT_EQ(notified.kind, Frame::Kind::notification) << "no answer is wanted";
  EXPECT_EQ(notified.params, (Array{Dictionary{{"sessionID", 7}}, nullptr, *list, true}));

  const MessageParameters event{
      .category = 3, .type = 65535, .payload = Dictionary{{"a", 1.5}}, .realtime = true, .promote = true};
  session().sendMessageWithDictionary(event.dictionary(), StringReply([](auto) {}));
  const Frame requested = peer->next();
  EXPECT_EQ(requested.kind, Frame::Kind::request);
  EXPECT_EQ(requested.params,
            (Array{Dictionary{{"category", 3}, {"type", 65535}, {"payload", Dictionary{{"a", 1.5}}}, {"flag", 3}}}));
}

TEST_F(Calls, malformedAnswersFailTheCallAndNothingElse) {
  const Value noCode = Dictionary{{"domain", "d"}, {"description", "x"}};
  const Value flushError = Dictionary{{"domain", "d"}, {"code", -1}, {"description", "Nothing to flush"}};
  const std::tuple<const char*, Value, Value> rows[] = {
      {nullptr, nullptr, Array{"sent", nullptr}},  // these two are in order
      {nullptr, nullptr, Array{nullptr, flushError}},
      {"too few values", nullptr, Array{"sent"}},
      {"too many values", nullptr, Array{"sent", nullptr, nullptr}},
      {"number for a text", nullptr, Array{5, nullptr}},
      {"error without a code", nullptr, Array{nullptr, noCode}},
      {"result that is not an array", nullptr, "sent"},
      {"neither error nor result", nullptr, nullptr},
      {"transport's error", "reply dropped", nullptr},
      {"error that is not a text", 17, Array{"sent", nullptr}},
  };
  for (const auto& [flaw, error, result] : rows) {
    Awaited<FlushReply> flushed;
    session().flushMessagesWithCompletion(flushed.reply());
    peer->respond(peer->next().messageID, error, result);
    const auto outcome = flushed.get();
    EXPECT_EQ(outcome.values.has_value(), flaw == nullptr) << result.description();
    EXPECT_EQ(outcome.error.text.empty(), flaw == nullptr) << result.description();
  }
}

TEST_F(Calls, whatTheDaemonSaysUnaskedIsIgnored) {
  Awaited<StringReply> reply;
  session().fetchDisplayURL(reply.reply());
  const Frame call = peer->next();
  peer->respond(call.messageID + 1000, nullptr, Array{"for no call"});
  peer->notify("brewCoffee", {1});
  peer->notify("removeFile", {"an unknown token"});
  peer->notify("removeFile", {});
  peer->notify("sendMessageToClient", {1, 2, 3});
  peer->write(request(1, "x"));
  EXPECT_FALSE(reply.isReady());
  peer->answer(call, {"at last"});
  EXPECT_EQ(textOf(reply.get()), "at last");
  // Under the same id no call waits any more.
  peer->answer(call, {"twice"});
  exchangeOneCall();
}

TEST_F(Calls, whatTheDaemonWouldBreakOffOverIsRefusedHere) {
  // One array more than the frame, its arguments and 62 levels of them.
  const auto nested = [](int levels) {
    Value value = 1;
    for (int i = 1; i < levels; ++i) value = Array{std::move(value)};
    return shared({{"deep", std::move(value)}});
  };
  Awaited<StringReply> fits, tooDeep, tooLarge;
  session().sendMessageWithCategory(1, 1, nested(62), fits.reply());
  session().sendMessageWithCategory(1, 1, nested(63), tooDeep.reply());
  session().sendMessageWithCategory(1, 1, shared({{"big", std::string(kMaximumFrameBytes, 'x')}}), tooLarge.reply());
  EXPECT_EQ(tooDeep.get().error.kind, CallErrorKind::refused);
  EXPECT_NE(tooLarge.get().error.text.find("limit"), std::string::npos);
  peer->answer(peer->next(), {"taken"});
  EXPECT_EQ(textOf(fits.get()), "taken");
  exchangeOneCall();
}

TEST_F(Calls, thatWouldFillTheDaemonsMemoryAreRefusedHere) {
#if defined(__SANITIZE_THREAD__) || defined(__SANITIZE_ADDRESS__)
  GTEST_SKIP() << "millions of values take minutes here";
#endif
  // 7 MB on the wire.
  Awaited<LogDataReply> tooCostly;
  session().uploadLogData(std::make_shared<const Array>(Array(7'000'000)), tooCostly.reply());
  EXPECT_FALSE(tooCostly.get().values);
  exchangeOneCall();
}

TEST_F(Calls, thatWaitMayBeMadeByTwoThreadsAtOnce) {
  auto calls = session().blocking();
  auto one = std::async(std::launch::async, [&] { return calls.sendMessage(1, 0, nullptr); });
  const Frame first = peer->next();
  auto two = std::async(std::launch::async, [&] { return calls.startConfig(); });
  peer->refuse(peer->next(), "not now");
  EXPECT_EQ(within(two).error().text, "not now");
  peer->answer(first, {"first"});
  EXPECT_EQ(within(one).value(), "first");
}

TEST_F(Calls, fromACallbackAreSentAndWaitingThereFails) {
  Awaited<StringReply> inner;
  std::promise<CallErrorKind> waiting;
  session().fetchDisplayURL(StringReply([&](StringReply::Outcome) {
    const auto result = session().blocking().fetchDisplayURL();
    waiting.set_value(result ? CallErrorKind::refused : result.error().kind);
    session().finishSessionWithReply(inner.reply());
  }));
  peer->answer(peer->expect("fetchDisplayURL"), {"URL"});
  auto kind = waiting.get_future();
  EXPECT_EQ(within(kind), CallErrorKind::wrongThread);
  peer->answer(peer->expect("finishSessionWithReply"), {nullptr});
  EXPECT_TRUE(inner.get().values);
}

}  // namespace
}  // namespace orvanta::test
