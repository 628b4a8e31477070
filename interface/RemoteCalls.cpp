#include "interface/RemoteCalls.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>
#include <limits>

// The tables, and the check of a call against them.

namespace orvanta {

namespace {

constexpr RemoteArgument kSetSessionInfoArguments[] = {{"sessionInfo", ArgumentType::dictionary},
                                                       {"userInfo", ArgumentType::dictionaryOrNil},
                                                       {"frameworksToCheck", ArgumentType::arrayOrNil},
                                                       {"hasAggregationBlock", ArgumentType::boolean}};
constexpr RemoteArgument kUserInfoArguments[] = {{"userInfo", ArgumentType::dictionaryOrNil}};
constexpr RemoteArgument kCategoryArguments[] = {
    {"category", ArgumentType::uint16}, {"type", ArgumentType::uint16}, {"payload", ArgumentType::dictionaryOrNil}};
constexpr RemoteArgument kDictionaryArguments[] = {{"messageParameters", ArgumentType::dictionary}};
constexpr RemoteArgument kUploadFileArguments[] = {{"fileURL", ArgumentType::string},
                                                   {"extensionToken", ArgumentType::stringOrNil}};
constexpr RemoteArgument kUploadLogDataArguments[] = {{"logData", ArgumentType::array}};
constexpr RemoteArgument kOneOffArguments[] = {{"sessionInfo", ArgumentType::dictionary},
                                               {"userInfo", ArgumentType::dictionaryOrNil},
                                               {"category", ArgumentType::uint16},
                                               {"type", ArgumentType::uint16},
                                               {"payload", ArgumentType::dictionaryOrNil}};
constexpr RemoteArgument kAggregatedEventArguments[] = {{"sessionInfo", ArgumentType::dictionaryOrNil},
                                                        {"timestamp", ArgumentType::number},
                                                        {"category", ArgumentType::uint16},
                                                        {"type", ArgumentType::uint16},
                                                        {"payload", ArgumentType::dictionaryOrNil}};
constexpr RemoteArgument kRemoveFileArguments[] = {{"token", ArgumentType::string}};

// In the order of RemoteCallID.
constexpr RemoteCall kRemoteCalls[kRemoteCallCount] = {
    {"setSessionInfo", kSetSessionInfoArguments, "nothing"},
    {"startConfigWithCompletionHandler", {}, "backend names or nil"},
    {"fetchStatesWithUserInfo", kUserInfoArguments, "backend names or nil"},
    {"fetchDisplayURL", {}, "string"},
    {"sendMessageWithCategory", kCategoryArguments, "string or nil"},
    {"sendMessageWithDictionary", kDictionaryArguments, "string or nil"},
    {"flushMessagesWithCompletion", {}, "string or nil, error map or nil"},
    {"finishSessionWithReply", {}, "string or nil"},
    {"uploadFileAtPath", kUploadFileArguments, "boolean"},
    {"uploadLogData", kUploadLogDataArguments, "boolean, error map or nil"},
    {"sendMessageWithSessionInfo", kOneOffArguments, "string"},
};

// In the order of RemoteNotificationID.
constexpr RemoteCall kRemoteNotifications[kRemoteNotificationCount] = {
    {"sendMessageToClient", kAggregatedEventArguments, nullptr},
    {"removeFile", kRemoveFileArguments, nullptr},
};

bool fits(const Value& value, ArgumentType type) {
  switch (type) {
    case ArgumentType::dictionary:
      return value.dictionary() != nullptr;
    case ArgumentType::dictionaryOrNil:
      return value.isNull() || value.dictionary() != nullptr;
    case ArgumentType::array:
      return value.array() != nullptr;
    case ArgumentType::arrayOrNil:
      return value.isNull() || value.array() != nullptr;
    case ArgumentType::boolean:
      return value.isBool();
    case ArgumentType::uint16: {
      const auto* number = std::get_if<std::int64_t>(&value.storage());
      return number != nullptr && *number >= 0 && *number <= std::numeric_limits<std::uint16_t>::max();
    }
    case ArgumentType::number:
      return value.isNumber();
    case ArgumentType::string:
      return value.string() != nullptr;
    case ArgumentType::stringOrNil:
      return value.isNull() || value.string() != nullptr;
  }
  return false;
}

}  // namespace

std::span<const RemoteCall, kRemoteCallCount> remoteCalls() {
  return kRemoteCalls;
}

const RemoteCall& remoteCall(RemoteCallID id) {
  return kRemoteCalls[static_cast<std::size_t>(id)];
}

const RemoteCall& remoteNotification(RemoteNotificationID id) {
  return kRemoteNotifications[static_cast<std::size_t>(id)];
}

std::optional<RemoteCallID> findRemoteCall(std::string_view method) {
  const auto* found = std::find_if(std::begin(kRemoteCalls), std::end(kRemoteCalls),
                                   [method](const RemoteCall& call) { return method == call.method; });
  if (found == std::end(kRemoteCalls)) return std::nullopt;
  return static_cast<RemoteCallID>(found - std::begin(kRemoteCalls));
}

const char* wireTypeText(ArgumentType type) {
  switch (type) {
    case ArgumentType::dictionary:
      return "a map";
    case ArgumentType::dictionaryOrNil:
      return "a map or nil";
    case ArgumentType::array:
      return "an array";
    case ArgumentType::arrayOrNil:
      return "an array or nil";
    case ArgumentType::boolean:
      return "a boolean";
    case ArgumentType::uint16:
      return "an integer from 0 to 65535";
    case ArgumentType::number:
      return "a number";
    case ArgumentType::string:
      return "a string";
    case ArgumentType::stringOrNil:
      return "a string or nil";
  }
  return "?";
}

std::optional<std::string> checkArguments(const RemoteCall& call, const Array& params) {
  if (params.size() != call.arguments.size()) {
    return fmt::format("{} takes {} arguments, {} were given", call.method, call.arguments.size(), params.size());
  }
  for (std::size_t i = 0; i < params.size(); ++i) {
    const auto& argument = call.arguments[i];
    if (!fits(params[i], argument.type)) {
      return fmt::format("{}: argument '{}' must be {}", call.method, argument.name, wireTypeText(argument.type));
    }
  }
  return std::nullopt;
}

}  // namespace orvanta
