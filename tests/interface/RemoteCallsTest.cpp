#include "interface/RemoteCalls.h"

#include <gtest/gtest.h>

#include <fstream>
#include <set>

#include "tests/support/LogCapture.h"
#include "tests/support/NotedSession.h"
#include "tests/support/RecordingConnection.h"

namespace orvanta::test {
namespace {
using platform::Frame;

class RemoteCallsTest : public ::testing::Test {
 protected:
  bool dispatch(const char* method, Array params, Frame::Kind kind = Frame::Kind::request) {
    outbox->frames.clear();
    Frame made;
    made.kind = kind;
    made.messageID = 7;
    made.method = method;
    made.params = std::move(params);
    return dispatchCall(std::move(made), session, outbox);
  }
  // The one answer; an empty frame, with a failure, when there is not exactly one.
  Frame answer() {
    EXPECT_EQ(outbox->frames.size(), 1U);
    return outbox->frames.empty() ? Frame() : outbox->frames.front();
  }

  std::shared_ptr<RecordingConnection::Received> outbox = std::make_shared<RecordingConnection::Received>();
  NotedSession session;
};

TEST_F(RemoteCallsTest, EveryOperationArrivesWithItsArgumentsAndAnswersInItsShape) {
  const Dictionary info{{"sessionID", 1}};
  const std::tuple<const char*, Array, const char*> rows[] = {
      {"setSessionInfo", {info, nullptr, nullptr, false}, "setSessionInfo {sessionID = 1}"},
      {"setSessionInfo", {info, info, Array{"f"}, true}, "setSessionInfo {sessionID = 1} user frameworks aggregates"},
      {"startConfigWithCompletionHandler", {}, "start"},
      {"fetchStatesWithUserInfo", {nullptr}, "states"},
      {"fetchStatesWithUserInfo", {info}, "states with user info"},
      {"fetchDisplayURL", {}, "url"},
      {"sendMessageWithCategory", {65535, 0, nullptr}, "send 65535 0"},
      {"sendMessageWithCategory", {1, 2, info}, "send 1 2 payload"},
      {"sendMessageWithDictionary", {info}, "dictionary {sessionID = 1}"},
      {"flushMessagesWithCompletion", {}, "flush"},
      {"finishSessionWithReply", {}, "finish"},
      {"uploadFileAtPath", {"file:///a", nullptr}, "upload file:///a -"},
      {"uploadFileAtPath", {"file:///a", "t"}, "upload file:///a t"},
      {"uploadLogData", {Value(Array{1, 2})}, "log data 2"},
      {"sendMessageWithSessionInfo", {info, nullptr, 3, 4, nullptr}, "one-off {sessionID = 1} 3"},
  };
  for (const auto& [method, params, called] : rows) {
    EXPECT_TRUE(dispatch(method, params)) << method;
    EXPECT_EQ(session.called, called);
    const auto response = answer();
    EXPECT_EQ(response.kind, Frame::Kind::response);
    EXPECT_EQ(response.messageID, 7U);
    EXPECT_TRUE(response.error.isNull());
    EXPECT_NE(response.result.array(), nullptr) << method;
  }
}

TEST_F(RemoteCallsTest, WhatDoesNotFitIsAnsweredAndNotCarriedOut) {
  const Dictionary info{{"sessionID", 1}};
  const std::tuple<const char*, Array, std::string> rows[] = {
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
  for (const auto& [method, params, error] : rows) {
    EXPECT_FALSE(dispatch(method, params));
    EXPECT_EQ(session.called, "") << method;
    EXPECT_EQ(answer().error, Value(error.starts_with("'") ? std::string(method) + ": argument " + error : error));
  }
}

TEST_F(RemoteCallsTest, NotificationsGetNoAnswerAndRefusedOnesALogLine) {
  LogCapture log;
  EXPECT_TRUE(dispatch("fetchDisplayURL", {}, Frame::Kind::notification));
  EXPECT_TRUE(outbox->frames.empty());
  EXPECT_FALSE(dispatch("fetchDisplayURL", {1}, Frame::Kind::notification));
  EXPECT_TRUE(outbox->frames.empty());
  EXPECT_EQ(log.count("Refused a call of 'fetchDisplayURL'"), 1U);
}

TEST_F(RemoteCallsTest, ADroppedReplyReachesTheCallerAsAnError) {
  session.fate = NotedSession::dropped;
  dispatch("fetchDisplayURL", {});
  EXPECT_EQ(answer().error, Value("the reply was dropped without being given"));
  session.fate = NotedSession::kept;
  dispatch("fetchDisplayURL", {});
  dispatch("fetchDisplayURL", {});  // its reply takes the place of the one before
  EXPECT_EQ(answer().error, Value("the reply was dropped without being given"));
}

TEST_F(RemoteCallsTest, RepliesOutliveTheirConnection) {
  session.fate = NotedSession::kept;
  dispatch("fetchDisplayURL", {});
  const std::weak_ptr<platform::Outbox> gone = std::exchange(outbox, nullptr);
  EXPECT_TRUE(gone.expired()) << "a reply keeps its connection's outbox alive";
  session.keptReply("late");
}

// How docs/protocol.md shows a call, up to what its last column says in words.
std::string documentedRow(const RemoteCall& call) {
  std::string row = "| `" + std::string(call.method) + "` | ";
  const char* separator = "";
  for (const auto& argument : call.arguments) {
    const std::string_view type = wireTypeText(argument.type);
    row += std::exchange(separator, ", ");
    row += std::string(argument.name) + ": " + std::string(type.substr(type.find(' ') + 1));
  }
  row += call.arguments.empty() ? "| " : " | ";
  return call.reply == nullptr ? row : row + call.reply + " |";
}

TEST(ProtocolDocument, ShowsTheTablesOfCallsAndNotifications) {
  std::ifstream document(ORVANTA_DOCS "/protocol.md");
  std::set<std::string> rows;
  std::size_t methods = 0;
  bool inTable = false;
  for (std::string line; std::getline(document, line);) {
    if (!line.starts_with('|')) inTable = false;
    if (line.starts_with("| Method |")) inTable = true;
    if (!inTable || !line.starts_with("| `")) continue;
    ++methods;
    rows.insert(line);
  }
  EXPECT_EQ(methods, kRemoteCallCount + kRemoteNotificationCount);
  for (const auto& call : remoteCalls()) EXPECT_TRUE(rows.count(documentedRow(call))) << documentedRow(call);
  for (const auto id : {RemoteNotificationID::sendMessageToClient, RemoteNotificationID::removeFile}) {
    const auto row = documentedRow(remoteNotification(id));
    const auto found = rows.lower_bound(row);
    EXPECT_TRUE(found != rows.end() && found->starts_with(row)) << row;
  }
}

}  // namespace
}  // namespace orvanta::test
