#include "interface/RemoteCalls.h"

#include <gtest/gtest.h>

#include "platform/MessagePack.h"
#include "tests/support/LogCapture.h"
#include "tests/support/RecordingConnection.h"
#include "tests/support/TestPlatform.h"

namespace orvanta::test {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Frame;
using platform::Value;

// Notes which operation was called with what.
class NotedSession final : public ClientSessionInterface {
 public:
  std::string called;
  StringReply keptReply;
  bool dropReplies = false;
  bool keepReplies = false;

  void setSessionInfo(SharedDictionary info, SharedDictionary user, SharedArray frameworks, bool aggregates,
                      DoneReply done) override {
    called = "setSessionInfo " + Value(*info).description() + (user ? " user" : "") +
             (frameworks ? " frameworks" : "") + (aggregates ? " aggregates" : "");
    done();
  }
  void startConfigWithCompletionHandler(BackendNamesReply reply) override {
    called = "start";
    reply(std::vector<std::string>{"a", "b"});
  }
  void fetchStatesWithUserInfo(SharedDictionary user, BackendNamesReply reply) override {
    called = user ? "states with user info" : "states";
    reply(std::nullopt);
  }
  void fetchDisplayURL(StringReply reply) override { answer("url", std::move(reply)); }
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                               StringReply reply) override {
    called = "send " + std::to_string(category) + " " + std::to_string(type) + (payload ? " payload" : "");
    answer(called, std::move(reply));
  }
  void sendMessageWithDictionary(SharedDictionary parameters, StringReply reply) override {
    answer("dictionary " + std::to_string(parameters->size()), std::move(reply));
  }
  void flushMessagesWithCompletion(FlushReply reply) override {
    called = "flush";
    reply("text", makeOrvantaError("went wrong", 503));
  }
  void finishSessionWithReply(StringReply reply) override {
    called = "finish";
    reply(std::nullopt);
  }
  void uploadFileAtPath(std::string url, std::optional<std::string> token, UploadReply reply) override {
    called = "upload " + url + " " + token.value_or("-");
    reply(true);
  }
  void uploadLogData(SharedArray data, LogDataReply reply) override {
    called = "log data " + std::to_string(data->size());
    reply(false, std::nullopt);
  }
  void sendMessageWithSessionInfo(SharedDictionary, SharedDictionary user, std::uint16_t category, std::uint16_t,
                                  SharedDictionary, StringReply reply) override {
    answer("one-off " + std::to_string(category) + (user ? " user" : ""), std::move(reply));
  }

 private:
  void answer(std::string text, StringReply reply) {
    called = text;
    if (dropReplies) return;
    if (keepReplies) {
      keptReply = std::move(reply);
      return;
    }
    reply(std::move(text));
  }
};

class RemoteCallsTest : public ::testing::Test {
 protected:
  Frame frame(const char* method, Array params, Frame::Kind kind = Frame::Kind::request) {
    Frame made;
    made.kind = kind;
    made.messageID = 7;
    made.method = method;
    made.params = std::move(params);
    return made;
  }
  // The one answer, or none.
  std::optional<Frame> answer() {
    auto& frames = outbox->frames;
    if (frames.size() != 1) return std::nullopt;
    return frames.front();
  }

  std::shared_ptr<RecordingConnection::Received> outbox = std::make_shared<RecordingConnection::Received>();
  NotedSession session;
};

TEST_F(RemoteCallsTest, EveryOperationArrivesWithItsArgumentsAndAnswersInItsShape) {
  const Dictionary info{{"sessionID", 1}};
  const struct {
    const char* method;
    Array params;
    const char* called;
  } rows[] = {
      {"setSessionInfo", {info, nullptr, nullptr, false}, "setSessionInfo {sessionID = 1}"},
      {"setSessionInfo", {info, info, Array{"f"}, true}, "setSessionInfo {sessionID = 1} user frameworks aggregates"},
      {"startConfigWithCompletionHandler", {}, "start"},
      {"fetchStatesWithUserInfo", {nullptr}, "states"},
      {"fetchStatesWithUserInfo", {info}, "states with user info"},
      {"fetchDisplayURL", {}, "url"},
      {"sendMessageWithCategory", {65535, 0, nullptr}, "send 65535 0"},
      {"sendMessageWithCategory", {1, 2, info}, "send 1 2 payload"},
      {"sendMessageWithDictionary", {info}, "dictionary 1"},
      {"flushMessagesWithCompletion", {}, "flush"},
      {"finishSessionWithReply", {}, "finish"},
      {"uploadFileAtPath", {"file:///a", nullptr}, "upload file:///a -"},
      {"uploadFileAtPath", {"file:///a", "t"}, "upload file:///a t"},
      {"uploadLogData", {Array{1, 2}}, "log data 2"},
      {"sendMessageWithSessionInfo", {info, nullptr, 3, 4, nullptr}, "one-off 3"},
  };
  for (const auto& row : rows) {
    outbox->frames.clear();
    EXPECT_TRUE(dispatchCall(frame(row.method, row.params), session, outbox)) << row.method;
    EXPECT_EQ(session.called, row.called);
    const auto response = answer();
    ASSERT_TRUE(response) << row.method;
    EXPECT_EQ(response->kind, Frame::Kind::response);
    EXPECT_EQ(response->messageID, 7U);
    EXPECT_TRUE(response->error.isNull());
    ASSERT_NE(response->result.array(), nullptr) << row.method;
  }
}

TEST_F(RemoteCallsTest, WhatDoesNotFitIsAnsweredAndNotCarriedOut) {
  const Dictionary info{{"sessionID", 1}};
  const struct {
    const char* method;
    Array params;
    const char* error;
  } rows[] = {
      {"noSuchOperation", {}, "unknown method 'noSuchOperation'"},
      {"", {}, "unknown method ''"},
      {"setSessionInfo", {info, nullptr, nullptr}, "setSessionInfo takes 4 arguments, 3 were given"},
      {"setSessionInfo", {info, nullptr, nullptr, false, 1}, "setSessionInfo takes 4 arguments, 5 were given"},
      {"setSessionInfo", {nullptr, nullptr, nullptr, false}, "'sessionInfo' must be a map"},
      {"setSessionInfo", {info, 5, nullptr, false}, "'userInfo' must be a map or nil"},
      {"setSessionInfo", {info, nullptr, "x", false}, "'frameworksToCheck' must be an array or nil"},
      {"setSessionInfo", {info, nullptr, nullptr, 1}, "'hasAggregationBlock' must be a boolean"},
      {"setSessionInfo", {info, nullptr, nullptr, nullptr}, "'hasAggregationBlock' must be a boolean"},
      {"sendMessageWithCategory", {65536, 0, nullptr}, "'category' must be an integer from 0 to 65535"},
      {"sendMessageWithCategory", {0, -1, nullptr}, "'type' must be an integer from 0 to 65535"},
      {"sendMessageWithCategory", {0, 1.0, nullptr}, "'type' must be an integer from 0 to 65535"},
      {"sendMessageWithCategory", {0, 18446744073709551615ULL, nullptr}, "'type' must be an integer from 0 to 65535"},
      {"sendMessageWithCategory", {true, 0, nullptr}, "'category' must be an integer from 0 to 65535"},
      {"sendMessageWithCategory", {0, 0, Array{}}, "'payload' must be a map or nil"},
      {"sendMessageWithDictionary", {nullptr}, "'messageParameters' must be a map"},
      {"uploadFileAtPath", {nullptr, nullptr}, "'fileURL' must be a string"},
      {"uploadFileAtPath", {"file:///a", 3}, "'extensionToken' must be a string or nil"},
      {"uploadLogData", {nullptr}, "'logData' must be an array"},
      {"sendMessageWithSessionInfo", {nullptr, nullptr, 0, 0, nullptr}, "'sessionInfo' must be a map"},
  };
  for (const auto& row : rows) {
    outbox->frames.clear();
    session.called.clear();
    EXPECT_FALSE(dispatchCall(frame(row.method, row.params), session, outbox));
    EXPECT_EQ(session.called, "") << row.method;
    const auto response = answer();
    ASSERT_TRUE(response) << row.error;
    ASSERT_NE(response->error.string(), nullptr);
    const std::string expected = row.error[0] == '\'' ? std::string(row.method) + ": argument " + row.error : row.error;
    EXPECT_EQ(*response->error.string(), expected);
  }
}

TEST_F(RemoteCallsTest, NotificationsGetNoAnswerAndRefusedOnesALogLine) {
  LogCapture log;
  EXPECT_TRUE(dispatchCall(frame("fetchDisplayURL", {}, Frame::Kind::notification), session, outbox));
  EXPECT_FALSE(dispatchCall(frame("fetchDisplayURL", {1}, Frame::Kind::notification), session, outbox));
  EXPECT_TRUE(outbox->frames.empty());
  EXPECT_EQ(log.count("Refused a call of 'fetchDisplayURL'"), 1U);
}

TEST_F(RemoteCallsTest, ADroppedReplyReachesTheCallerAsAnError) {
  session.dropReplies = true;
  dispatchCall(frame("fetchDisplayURL", {}), session, outbox);
  const auto response = answer();
  ASSERT_TRUE(response);
  EXPECT_EQ(*response->error.string(), "the reply was dropped without being given");
}

TEST_F(RemoteCallsTest, RepliesOutliveTheirConnection) {
  std::weak_ptr<platform::Outbox> gone;
  {
    const auto shortLived = std::make_shared<RecordingConnection::Received>();
    gone = shortLived;
    session.keepReplies = true;
    dispatchCall(frame("fetchDisplayURL", {}), session, shortLived);
  }
  EXPECT_TRUE(gone.expired()) << "a reply keeps its connection's outbox alive";
  session.keptReply("late");
}

TEST_F(RemoteCallsTest, ResponsesReadBackAsTheValuesThatWereGiven) {
  dispatchCall(frame("flushMessagesWithCompletion", {}), session, outbox);
  std::optional<FlushReply::Outcome> flushed;
  deliverResponse(std::move(outbox->frames.front()), FlushReply([&](auto outcome) { flushed = std::move(outcome); }));
  ASSERT_TRUE(flushed && flushed->values);
  EXPECT_EQ(std::get<0>(*flushed->values), "text");
  EXPECT_EQ(std::get<1>(*flushed->values), makeOrvantaError("went wrong", 503));

  outbox->frames.clear();
  dispatchCall(frame("startConfigWithCompletionHandler", {}), session, outbox);
  std::optional<BackendNamesReply::Outcome> names;
  deliverResponse(std::move(outbox->frames.front()),
                  BackendNamesReply([&](auto outcome) { names = std::move(outcome); }));
  ASSERT_TRUE(names && names->values);
  EXPECT_EQ(std::get<0>(*names->values), (std::vector<std::string>{"a", "b"}));
}

TEST_F(RemoteCallsTest, MalformedResponsesFailTheReply) {
  const Value results[] = {nullptr,
                           5,
                           Array{},
                           Array{"x", "y", "z"},
                           Array{1, nullptr},
                           Array{"x", "no error map"},
                           Array{"x", Dictionary{{"code", 1}}}};
  for (const auto& result : results) {
    Frame response;
    response.kind = Frame::Kind::response;
    response.result = result;
    std::optional<FlushReply::Outcome> outcome;
    deliverResponse(std::move(response), FlushReply([&](auto given) { outcome = std::move(given); }));
    ASSERT_TRUE(outcome);
    EXPECT_FALSE(outcome->values) << result.description();
    EXPECT_FALSE(outcome->error.text.empty());
  }
}

TEST_F(RemoteCallsTest, AggregatedEventsAndTheEndNoticeSurviveTheWire) {
  const auto info = std::make_shared<const Dictionary>(Dictionary{{"sessionID", 4}});
  outbox->send(encodeSendMessageToClient(info, 12.25, 9, 8, nullptr), platform::Outbox::Urgency::reply);
  outbox->send(encodeSendMessageToClient(nullptr, 0, 0, 0, nullptr), platform::Outbox::Urgency::reply);
  ASSERT_EQ(outbox->frames.size(), 2U);
  const auto event = decodeSendMessageToClient(outbox->frames[0]);
  ASSERT_TRUE(event);
  EXPECT_EQ(*event->sessionInfo, *info);
  EXPECT_EQ(event->timestamp, 12.25);
  EXPECT_EQ(event->category, 9);
  EXPECT_EQ(event->type, 8);
  EXPECT_FALSE(event->payload);
  EXPECT_FALSE(event->isEndNotice());
  const auto notice = decodeSendMessageToClient(outbox->frames[1]);
  ASSERT_TRUE(notice);
  EXPECT_TRUE(notice->isEndNotice());
}

}  // namespace
}  // namespace orvanta::test
