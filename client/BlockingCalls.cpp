#include "client/BlockingCalls.h"

#include <future>
#include <tuple>
#include <type_traits>
#include <utility>

#include "client/CallChannel.h"
#include "client/ClientSession.h"

namespace orvanta {

using OptionalText = std::optional<std::string>;

BlockingCalls::BlockingCalls(ClientSession& session, CallChannel& channel) : _session(session), _channel(channel) {}

template <class Answer, class AnyReply, class MakeCall>
CallResult<Answer> BlockingCalls::wait(MakeCall makeCall) {
  if (_channel.thread().isCurrent()) {
    return CallError{"a call that waits was made in a callback of the library, where its answer could never come",
                     CallErrorKind::wrongThread};
  }
  _channel.waitForRoom();
  using Outcome = typename AnyReply::Outcome;
  std::promise<Outcome> promise;
  auto answered = promise.get_future();
  makeCall(
      AnyReply([promise = std::move(promise)](Outcome outcome) mutable { promise.set_value(std::move(outcome)); }));
  auto outcome = answered.get();
  if (!outcome.values) return std::move(outcome.error);
  if constexpr (std::is_void_v<Answer>) {
    return {};
  } else {
    return std::apply([](auto&&... values) { return Answer{std::move(values)...}; }, std::move(*outcome.values));
  }
}

CallResult<BackendNames> BlockingCalls::configure(const SessionInfo& sessionInfo,
                                                  const std::optional<UserInfo>& userInfo) {
  const auto set = setSessionInfo(sessionInfo.dictionary(), userInfo ? userInfo->dictionary() : nullptr, nullptr,
                                  _session.hasAggregationHandler());
  if (!set) return set.error();
  return startConfig();
}

CallResult<void> BlockingCalls::setSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                               SharedArray frameworksToCheck, bool hasAggregationBlock) {
  return wait<void, DoneReply>([&](DoneReply reply) {
    _session.setSessionInfo(std::move(sessionInfo), std::move(userInfo), std::move(frameworksToCheck),
                            hasAggregationBlock, std::move(reply));
  });
}

CallResult<BackendNames> BlockingCalls::startConfig() {
  return wait<BackendNames, BackendNamesReply>(
      [&](BackendNamesReply reply) { _session.startConfigWithCompletionHandler(std::move(reply)); });
}

CallResult<BackendNames> BlockingCalls::fetchStates(SharedDictionary userInfo) {
  return wait<BackendNames, BackendNamesReply>(
      [&](BackendNamesReply reply) { _session.fetchStatesWithUserInfo(std::move(userInfo), std::move(reply)); });
}

CallResult<OptionalText> BlockingCalls::fetchDisplayURL() {
  return wait<OptionalText, StringReply>([&](StringReply reply) { _session.fetchDisplayURL(std::move(reply)); });
}

CallResult<OptionalText> BlockingCalls::sendMessage(std::uint16_t category, std::uint16_t type,
                                                    SharedDictionary payload) {
  return wait<OptionalText, StringReply>([&](StringReply reply) {
    _session.sendMessageWithCategory(category, type, std::move(payload), std::move(reply));
  });
}

CallResult<OptionalText> BlockingCalls::sendMessage(SharedDictionary parameters) {
  return wait<OptionalText, StringReply>(
      [&](StringReply reply) { _session.sendMessageWithDictionary(std::move(parameters), std::move(reply)); });
}

CallResult<OptionalText> BlockingCalls::sendMessage(const MessageParameters& parameters) {
  return sendMessage(parameters.dictionary());
}

CallResult<FlushAnswer> BlockingCalls::flushMessages() {
  return wait<FlushAnswer, FlushReply>(
      [&](FlushReply reply) { _session.flushMessagesWithCompletion(std::move(reply)); });
}

CallResult<OptionalText> BlockingCalls::finishSession() {
  return wait<OptionalText, StringReply>([&](StringReply reply) { _session.finishSessionWithReply(std::move(reply)); });
}

CallResult<bool> BlockingCalls::uploadFile(const std::string& path) {
  return wait<bool, UploadReply>(
      [&](UploadReply reply) { _session.uploadFile(path, std::nullopt, true, std::move(reply)); });
}

CallResult<LogDataAnswer> BlockingCalls::uploadLogData(SharedArray logData) {
  return wait<LogDataAnswer, LogDataReply>(
      [&](LogDataReply reply) { _session.uploadLogData(std::move(logData), std::move(reply)); });
}

CallResult<OptionalText> BlockingCalls::sendMessage(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                                    std::uint16_t category, std::uint16_t type,
                                                    SharedDictionary payload) {
  return wait<OptionalText, StringReply>([&](StringReply reply) {
    _session.sendMessageWithSessionInfo(std::move(sessionInfo), std::move(userInfo), category, type, std::move(payload),
                                        std::move(reply));
  });
}

}  // namespace orvanta
