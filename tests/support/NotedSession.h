#pragma once

#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "interface/RemoteCalls.h"
#include "interface/Values.h"

namespace orvanta::test {

// Notes which operation was called with what.
class NotedSession final : public ClientSessionInterface {
 public:
  std::string called;
  enum { given, dropped, kept } fate = given;  // of replies; those without a text are never kept but dropped
  StringReply keptReply;

  void setSessionInfo(SharedDictionary info, SharedDictionary user, SharedArray frameworks, bool aggregates,
                      DoneReply done) override {
    note("setSessionInfo " + Value(*info).description() + (user ? " user" : "") + (frameworks ? " frameworks" : "") +
             (aggregates ? " aggregates" : ""),
         std::move(done));
  }
  void startConfigWithCompletionHandler(BackendNamesReply reply) override {
    note("start", std::move(reply), std::vector<std::string>{"a", "b"});
  }
  void fetchStatesWithUserInfo(SharedDictionary user, BackendNamesReply reply) override {
    note(user ? "states with user info" : "states", std::move(reply), std::nullopt);
  }
  void fetchDisplayURL(StringReply reply) override { note("url", std::move(reply), "text"); }
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                               StringReply reply) override {
    note("send " + std::to_string(category) + " " + std::to_string(type) + (payload ? " payload" : ""),
         std::move(reply), "text");
  }
  void sendMessageWithDictionary(SharedDictionary parameters, StringReply reply) override {
    note("dictionary " + Value(*parameters).description(), std::move(reply), "text");
  }
  void flushMessagesWithCompletion(FlushReply reply) override {
    note("flush", std::move(reply), "text", makeOrvantaError("went wrong", 503));
  }
  void finishSessionWithReply(StringReply reply) override { note("finish", std::move(reply), std::nullopt); }
  void uploadFileAtPath(std::string url, std::optional<std::string> token, UploadReply reply) override {
    note("upload " + url + " " + token.value_or("-"), std::move(reply), true);
  }
  void uploadLogData(SharedArray data, LogDataReply reply) override {
    note("log data " + std::to_string(data->size()), std::move(reply), false, makeOrvantaError("went wrong", -1));
  }
  void sendMessageWithSessionInfo(SharedDictionary info, SharedDictionary user, std::uint16_t category, std::uint16_t,
                                  SharedDictionary, StringReply reply) override {
    note("one-off " + Value(*info).description() + " " + std::to_string(category) + (user ? " user" : ""),
         std::move(reply), "text");
  }

 private:
  template <class AnyReply, class... Values>
  void note(std::string text, AnyReply reply, Values... values) {
    called = std::move(text);
    if (fate == given) reply(std::move(values)...);
    if constexpr (std::is_same_v<AnyReply, StringReply>) {
      if (fate == kept) keptReply = std::move(reply);
    }
  }
};

}  // namespace orvanta::test
