// What each operation looks like on the wire, and how answers find their way back.

#include <functional>
#include <vector>

#include "interface/WireLimits.h"
#include "tests/client/ClientFixture.h"

namespace orvanta::test {

using platform::Array;
using platform::Dictionary;
using platform::Frame;
using platform::Value;

namespace {

class Calls : public ClientFixture {};

struct WireRow {
  const char* method;
  std::function<void(ClientSession&, bool wantsReply)> call;
  Array params;
};

template <class AnyReply>
AnyReply ignored(bool wanted) {
  return wanted ? AnyReply([](auto) {}) : AnyReply();
}

std::vector<WireRow> wireRows() {
  const auto info = shared({{"sessionID", 7}});
  const auto user = shared({{"clientName", "n"}});
  const auto payload = shared({{"a", 1.5}});
  const auto list = std::make_shared<const Array>(Array{"x", platform::Date{5}, platform::Data{{1, 2}}});
  return {
      {"setSessionInfo",
       [=](ClientSession& s, bool r) { s.setSessionInfo(info, user, list, true, ignored<DoneReply>(r)); },
       {*info, *user, *list, true}},
      {"setSessionInfo",
       [=](ClientSession& s, bool r) { s.setSessionInfo(info, nullptr, nullptr, false, ignored<DoneReply>(r)); },
       {*info, nullptr, nullptr, false}},
      {"startConfigWithCompletionHandler",
       [=](ClientSession& s, bool r) { s.startConfigWithCompletionHandler(ignored<BackendNamesReply>(r)); },
       {}},
      {"fetchStatesWithUserInfo",
       [=](ClientSession& s, bool r) { s.fetchStatesWithUserInfo(user, ignored<BackendNamesReply>(r)); },
       {Value(*user)}},
      {"fetchStatesWithUserInfo",
       [=](ClientSession& s, bool r) { s.fetchStatesWithUserInfo(nullptr, ignored<BackendNamesReply>(r)); },
       {nullptr}},
      {"fetchDisplayURL", [=](ClientSession& s, bool r) { s.fetchDisplayURL(ignored<StringReply>(r)); }, {}},
      {"sendMessageWithCategory",
       [=](ClientSession& s, bool r) { s.sendMessageWithCategory(65535, 2, payload, ignored<StringReply>(r)); },
       {65535, 2, *payload}},
      {"sendMessageWithDictionary",
       [=](ClientSession& s, bool r) {
         s.sendMessageWithDictionary(
             MessageParameters{.category = 3, .type = 4, .payload = *payload, .realtime = true, .promote = true}
                 .dictionary(),
             ignored<StringReply>(r));
       },
       {Dictionary{{"category", 3}, {"type", 4}, {"payload", *payload}, {"flag", 3}}}},
      {"flushMessagesWithCompletion",
       [=](ClientSession& s, bool r) { s.flushMessagesWithCompletion(ignored<FlushReply>(r)); },
       {}},
      {"finishSessionWithReply",
       [=](ClientSession& s, bool r) { s.finishSessionWithReply(ignored<StringReply>(r)); },
       {}},
      {"uploadFileAtPath",
       [=](ClientSession& s, bool r) {
         s.uploadFileAtPath(std::string("file:///nowhere"), std::nullopt, ignored<UploadReply>(r));
       },
       {"file:///nowhere", nullptr}},
      {"uploadLogData",
       [=](ClientSession& s, bool r) { s.uploadLogData(list, ignored<LogDataReply>(r)); },
       {Value(*list)}},
      {"sendMessageWithSessionInfo",
       [=](ClientSession& s, bool r) {
         s.sendMessageWithSessionInfo(info, nullptr, 1, 0, nullptr, ignored<StringReply>(r));
       },
       {*info, nullptr, 1, 0, nullptr}},
  };
}

TEST_F(Calls, goOutInDeclaredOrderAsRequestsOrNotifications) {
  for (const auto& row : wireRows()) {
    for (const bool wantsReply : {true, false}) {
      row.call(session(), wantsReply);
      const Frame frame = peer->next();
      EXPECT_EQ(frame.method, row.method);
      EXPECT_EQ(frame.kind, wantsReply ? Frame::Kind::request : Frame::Kind::notification) << row.method;
      EXPECT_EQ(frame.params, row.params) << row.method;
      EXPECT_FALSE(frame.refusal) << row.method;
    }
  }
}

TEST_F(Calls, answersInAnyOrderReachTheirCallers) {
  Awaited<StringReply> first, second, third;
  session().sendMessageWithCategory(1, 1, nullptr, first.reply());
  session().sendMessageWithCategory(2, 1, nullptr, second.reply());
  session().fetchDisplayURL(third.reply());
  const Frame one = peer->next(), two = peer->next(), three = peer->next();
  peer->answer(three, {"three"});
  peer->answer(one, {nullptr});
  peer->refuse(two, "no such thing");
  EXPECT_EQ(textOf(third.get()), "three");
  EXPECT_EQ(textOf(first.get()), "(null)");
  const auto refused = second.get();
  EXPECT_EQ(textOf(refused), "error: no such thing");
  EXPECT_EQ(refused.error.kind, CallErrorKind::refused);
}

struct AnswerRow {
  const char* name;
  Value error;
  Value result;
  bool accepted;
};

TEST_F(Calls, malformedAnswersFailTheCallAndNothingElse) {
  const Value error = Dictionary{{"domain", "d"}, {"code", -1}, {"description", "Nothing to flush"}};
  const AnswerRow rows[] = {
      {"text and no error", nullptr, Array{"sent", nullptr}, true},
      {"error object", nullptr, Array{nullptr, error}, true},
      {"too few values", nullptr, Array{"sent"}, false},
      {"too many values", nullptr, Array{"sent", nullptr, nullptr}, false},
      {"number for a text", nullptr, Array{5, nullptr}, false},
      {"error without a code", nullptr, Array{nullptr, Dictionary{{"domain", "d"}, {"description", "x"}}}, false},
      {"result that is no array", nullptr, "sent", false},
      {"neither error nor result", nullptr, nullptr, false},
      {"transport's error", "reply dropped", nullptr, false},
      {"error that is no text", 17, Array{"sent", nullptr}, false},
  };
  for (const auto& row : rows) {
    Awaited<FlushReply> flushed;
    session().flushMessagesWithCompletion(flushed.reply());
    peer->respond(peer->next().messageID, row.error, row.result);
    const auto outcome = flushed.get();
    EXPECT_EQ(outcome.values.has_value(), row.accepted) << row.name;
    EXPECT_EQ(outcome.error.text.empty(), row.accepted) << row.name;
  }
}

TEST_F(Calls, whatTheDaemonSaysUnaskedIsIgnored) {
  Awaited<StringReply> reply;
  session().fetchDisplayURL(reply.reply());
  const Frame call = peer->next();
  peer->respond(call.messageID + 1000, nullptr, Array{"for nobody"});
  peer->notify("brewCoffee", {1});
  peer->notify("removeFile", {"a token of nobody's"});
  peer->notify("removeFile", {});
  peer->notify("sendMessageToClient", {1, 2, 3});
  const std::uint8_t request[] = {0x94, 0x00, 0x01, 0xa1, 'x', 0x90};
  peer->sendBytes(request);
  EXPECT_FALSE(reply.isReady());
  peer->answer(call, {"at last"});
  EXPECT_EQ(textOf(reply.get()), "at last");
  // The same id again finds nobody.
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

TEST_F(Calls, thatWaitBringAnswersOrReasons) {
  auto calls = session().blocking();
  const auto ask = [](auto call) { return std::async(std::launch::async, call); };

  auto configured =
      ask([&] { return calls.configure({.sessionID = 9, .clientType = 7}, UserInfo{.clientName = "n"}); });
  const Frame set = peer->expect("setSessionInfo");
  EXPECT_EQ(set.params[0].dictionary()->find("clientType")->integerValue(), 7);
  EXPECT_EQ(set.params[1], Value(Dictionary{{"clientName", "n"}}));
  EXPECT_EQ(set.params[3], Value(false));
  peer->answer(set, {});
  peer->answer(peer->expect("startConfigWithCompletionHandler"), {Value(Array{"http_post", "dashboard"})});
  const auto names = within(configured);
  ASSERT_TRUE(names);
  EXPECT_EQ(*names, BackendNames({"http_post", "dashboard"}));

  auto flushed = ask([&] { return calls.flushMessages(); });
  peer->answer(peer->expect("flushMessagesWithCompletion"),
               {nullptr, Dictionary{{"domain", "d"}, {"code", 503}, {"description", "unavailable"}}});
  const auto flush = within(flushed);
  ASSERT_TRUE(flush);
  EXPECT_EQ(flush->error, (OrvantaError{"d", 503, "unavailable"}));

  auto uploaded = ask([&] { return calls.uploadLogData(std::make_shared<const Array>(Array{1})); });
  peer->answer(peer->expect("uploadLogData"), {true, nullptr});
  const auto upload = within(uploaded);
  ASSERT_TRUE(upload);
  EXPECT_TRUE(upload->uploaded);

  auto refused = ask([&] { return calls.startConfig(); });
  peer->refuse(peer->next(), "not now");
  const auto refusal = within(refused);
  ASSERT_FALSE(refusal);
  EXPECT_EQ(refusal.error().text, "not now");
}

TEST_F(Calls, thatWaitMayBeMadeByTwoThreadsAtOnce) {
  auto calls = session().blocking();
  auto one = std::async(std::launch::async, [&] { return calls.sendMessage(1, 0, nullptr); });
  const Frame first = peer->next();
  auto two = std::async(std::launch::async, [&] { return calls.sendMessage(2, 0, nullptr); });
  const Frame second = peer->next();
  peer->answer(second, {"second"});
  EXPECT_EQ(within(two).value(), "second");
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
