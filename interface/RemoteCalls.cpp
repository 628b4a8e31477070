#include "interface/RemoteCalls.h"

#include <fmt/format.h>

#include <limits>

#include "interface/OrvantaLogging.h"
#include "platform/codec/MessagePack.h"

namespace orvanta {
using platform::Frame;
using platform::MessagePackWriter;
using platform::Outbox;

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

constexpr RemoteCall kRemoteCalls[11] = {
    {RemoteCallID::setSessionInfo, "setSessionInfo", kSetSessionInfoArguments, "none"},
    {RemoteCallID::startConfigWithCompletionHandler, "startConfigWithCompletionHandler", {}, "backend names or nil"},
    {RemoteCallID::fetchStatesWithUserInfo, "fetchStatesWithUserInfo", kUserInfoArguments, "backend names or nil"},
    {RemoteCallID::fetchDisplayURL, "fetchDisplayURL", {}, "string"},
    {RemoteCallID::sendMessageWithCategory, "sendMessageWithCategory", kCategoryArguments, "string or nil"},
    {RemoteCallID::sendMessageWithDictionary, "sendMessageWithDictionary", kDictionaryArguments, "string or nil"},
    {RemoteCallID::flushMessagesWithCompletion, "flushMessagesWithCompletion", {}, "string or nil, error or nil"},
    {RemoteCallID::finishSessionWithReply, "finishSessionWithReply", {}, "string or nil"},
    {RemoteCallID::uploadFileAtPath, "uploadFileAtPath", kUploadFileArguments, "boolean"},
    {RemoteCallID::uploadLogData, "uploadLogData", kUploadLogDataArguments, "boolean, error or nil"},
    {RemoteCallID::sendMessageWithSessionInfo, "sendMessageWithSessionInfo", kOneOffArguments, "string"},
};

const char* typeName(ArgumentType type) {
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
    case ArgumentType::string:
      return "a string";
    case ArgumentType::stringOrNil:
      return "a string or nil";
  }
  return "?";
}

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
    case ArgumentType::string:
      return value.string() != nullptr;
    case ArgumentType::stringOrNil:
      return value.isNull() || value.string() != nullptr;
  }
  return false;
}

// Takes checked arguments out of the frame.
class ArgumentReader {
 public:
  explicit ArgumentReader(Array& params) : _params(params) {}
  SharedDictionary dictionary() {
    Value& value = next();
    auto* held = value.dictionary();
    return held == nullptr ? nullptr : std::make_shared<const Dictionary>(std::move(*held));
  }
  SharedArray array() {
    Value& value = next();
    auto* held = value.array();
    return held == nullptr ? nullptr : std::make_shared<const Array>(std::move(*held));
  }
  bool boolean() { return std::get<bool>(next().storage()); }
  std::uint16_t uint16() { return static_cast<std::uint16_t>(std::get<std::int64_t>(next().storage())); }
  std::string string() { return std::move(*next().string()); }
  std::optional<std::string> stringOrNil() {
    Value& value = next();
    if (value.isNull()) return std::nullopt;
    return std::move(*value.string());
  }

 private:
  Value& next() { return _params[_index++]; }
  Array& _params;
  std::size_t _index = 0;
};

void write(MessagePackWriter& out, bool v) {
  out.boolean(v);
}
void write(MessagePackWriter& out, const std::optional<std::string>& v) {
  if (v) {
    out.string(*v);
  } else {
    out.nil();
  }
}
void write(MessagePackWriter& out, const BackendNames& v) {
  if (!v) {
    out.nil();
    return;
  }
  out.arrayHeader(v->size());
  for (const auto& name : *v) out.string(name);
}
void write(MessagePackWriter& out, const std::optional<OrvantaError>& v) {
  if (!v) {
    out.nil();
    return;
  }
  out.mapHeader(3);
  out.string("domain");
  out.string(v->domain);
  out.string("code");
  out.integer(v->code);
  out.string("description");
  out.string(v->description);
}

// A reply that answers the request `messageID` through the outbox, which may be gone by then.
template <class R>
struct ReplyMaker;

template <class... Values>
struct ReplyMaker<Reply<Values...>> {
  static Reply<Values...> make(const Frame& frame, const std::shared_ptr<Outbox>& outbox) {
    if (frame.kind != Frame::Kind::request) return {};
    return Reply<Values...>([weak = std::weak_ptr<Outbox>(outbox), id = frame.messageID](auto outcome) {
      const auto live = weak.lock();
      if (!live) return;
      std::vector<std::uint8_t> message;
      message.reserve(64);
      if (outcome.values) {
        platform::appendResponseHeader(message, id);
        MessagePackWriter out(message);
        out.nil();
        out.arrayHeader(sizeof...(Values));
        std::apply([&](const auto&... values) { (write(out, values), ...); }, *outcome.values);
      } else {
        platform::appendErrorResponse(message, id, outcome.error.text);
      }
      live->send(message);
    });
  }
};

void refuse(const Frame& frame, const std::shared_ptr<Outbox>& outbox, std::string_view reason) {
  if (frame.kind == Frame::Kind::request) {
    std::vector<std::uint8_t> message;
    platform::appendErrorResponse(message, frame.messageID, reason);
    outbox->send(message);
  }
  ORVANTA_LOG(info, "dispatchCall: Refused a call of '{}': {}", frame.method, reason);
}

void call(RemoteCallID id, Frame& frame, ClientSessionInterface& target, const std::shared_ptr<Outbox>& outbox) {
  ArgumentReader in(frame.params);
  switch (id) {
    case RemoteCallID::setSessionInfo: {
      auto sessionInfo = in.dictionary();
      auto userInfo = in.dictionary();
      auto frameworks = in.array();
      const bool hasAggregationBlock = in.boolean();
      return target.setSessionInfo(std::move(sessionInfo), std::move(userInfo), std::move(frameworks),
                                   hasAggregationBlock, ReplyMaker<DoneReply>::make(frame, outbox));
    }
    case RemoteCallID::startConfigWithCompletionHandler:
      return target.startConfigWithCompletionHandler(ReplyMaker<BackendNamesReply>::make(frame, outbox));
    case RemoteCallID::fetchStatesWithUserInfo:
      return target.fetchStatesWithUserInfo(in.dictionary(), ReplyMaker<BackendNamesReply>::make(frame, outbox));
    case RemoteCallID::fetchDisplayURL:
      return target.fetchDisplayURL(ReplyMaker<StringReply>::make(frame, outbox));
    case RemoteCallID::sendMessageWithCategory: {
      const auto category = in.uint16();
      const auto type = in.uint16();
      return target.sendMessageWithCategory(category, type, in.dictionary(),
                                            ReplyMaker<StringReply>::make(frame, outbox));
    }
    case RemoteCallID::sendMessageWithDictionary:
      return target.sendMessageWithDictionary(in.dictionary(), ReplyMaker<StringReply>::make(frame, outbox));
    case RemoteCallID::flushMessagesWithCompletion:
      return target.flushMessagesWithCompletion(ReplyMaker<FlushReply>::make(frame, outbox));
    case RemoteCallID::finishSessionWithReply:
      return target.finishSessionWithReply(ReplyMaker<StringReply>::make(frame, outbox));
    case RemoteCallID::uploadFileAtPath: {
      auto url = in.string();
      auto token = in.stringOrNil();
      return target.uploadFileAtPath(std::move(url), std::move(token), ReplyMaker<UploadReply>::make(frame, outbox));
    }
    case RemoteCallID::uploadLogData:
      return target.uploadLogData(in.array(), ReplyMaker<LogDataReply>::make(frame, outbox));
    case RemoteCallID::sendMessageWithSessionInfo: {
      auto sessionInfo = in.dictionary();
      auto userInfo = in.dictionary();
      const auto category = in.uint16();
      const auto type = in.uint16();
      return target.sendMessageWithSessionInfo(std::move(sessionInfo), std::move(userInfo), category, type,
                                               in.dictionary(), ReplyMaker<StringReply>::make(frame, outbox));
    }
  }
}

}  // namespace

std::span<const RemoteCall, 11> remoteCalls() {
  return kRemoteCalls;
}

const RemoteCall* findRemoteCall(std::string_view method) {
  for (const auto& entry : kRemoteCalls) {
    if (method == entry.method) return &entry;
  }
  return nullptr;
}

std::optional<std::string> checkArguments(const RemoteCall& call, const Array& params) {
  if (params.size() != call.arguments.size()) {
    return fmt::format("{} takes {} arguments, {} were given", call.method, call.arguments.size(), params.size());
  }
  for (std::size_t i = 0; i < params.size(); ++i) {
    const auto& argument = call.arguments[i];
    if (!fits(params[i], argument.type)) {
      return fmt::format("{}: argument '{}' must be {}", call.method, argument.name, typeName(argument.type));
    }
  }
  return std::nullopt;
}

bool dispatchCall(Frame&& frame, ClientSessionInterface& target, const std::shared_ptr<Outbox>& outbox) {
  if (frame.refusal) {
    refuse(frame, outbox, *frame.refusal);
    return false;
  }
  const RemoteCall* entry = findRemoteCall(frame.method);
  if (entry == nullptr) {
    refuse(frame, outbox, fmt::format("unknown method '{}'", std::string_view(frame.method).substr(0, 100)));
    return false;
  }
  if (const auto problem = checkArguments(*entry, frame.params)) {
    refuse(frame, outbox, *problem);
    return false;
  }
  call(entry->id, frame, target, outbox);
  return true;
}

std::vector<std::uint8_t> encodeSendMessageToClient(const SharedDictionary& sessionInfo, double timestamp,
                                                    std::uint16_t category, std::uint16_t type,
                                                    const SharedDictionary& payload) {
  std::vector<std::uint8_t> message;
  message.reserve(256);
  platform::appendNotificationHeader(message, "sendMessageToClient", 5);
  MessagePackWriter out(message);
  const auto dictionaryOrNil = [&out](const SharedDictionary& value) {
    if (value) {
      out.dictionary(*value);
    } else {
      out.nil();
    }
  };
  dictionaryOrNil(sessionInfo);
  out.real(timestamp);
  out.unsignedInteger(category);
  out.unsignedInteger(type);
  dictionaryOrNil(payload);
  return message;
}

std::vector<std::uint8_t> encodeRemoveFile(std::string_view token) {
  std::vector<std::uint8_t> message;
  platform::appendNotificationHeader(message, "removeFile", 1);
  MessagePackWriter(message).string(token);
  return message;
}

std::optional<AggregatedEvent> decodeSendMessageToClient(Frame& frame) {
  if (frame.kind != Frame::Kind::notification || frame.method != "sendMessageToClient" || frame.refusal) return {};
  auto& params = frame.params;
  if (params.size() != 5 || !fits(params[0], ArgumentType::dictionaryOrNil) || !params[1].isNumber() ||
      !fits(params[2], ArgumentType::uint16) || !fits(params[3], ArgumentType::uint16) ||
      !fits(params[4], ArgumentType::dictionaryOrNil)) {
    return {};
  }
  AggregatedEvent event;
  event.timestamp = params[1].doubleValue();
  ArgumentReader first(params);
  event.sessionInfo = first.dictionary();
  event.category = static_cast<std::uint16_t>(params[2].integerValue());
  event.type = static_cast<std::uint16_t>(params[3].integerValue());
  if (auto* payload = params[4].dictionary()) {
    event.payload = std::make_shared<const Dictionary>(std::move(*payload));
  }
  return event;
}

std::optional<std::string> decodeRemoveFile(const Frame& frame) {
  if (frame.kind != Frame::Kind::notification || frame.method != "removeFile" || frame.refusal) return {};
  if (frame.params.size() != 1 || frame.params[0].string() == nullptr) return {};
  return *frame.params[0].string();
}

}  // namespace orvanta
