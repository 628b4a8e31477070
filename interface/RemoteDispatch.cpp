#include <fmt/format.h>

#include "interface/OrvantaLogging.h"
#include "interface/RemoteCalls.h"
#include "interface/WireLimits.h"
#include "platform/codec/MessagePack.h"

// The daemon's side: from a frame to the session's operation, and from its reply to the response.
//
// A frame takes one of three ways:
//
//   refused    the decoder, the table or the argument check finds fault: the session never hears of it
//   request    the session gets a reply that holds the message id; called, it sends the values, dropped, an error
//   notified   the session gets an empty reply, so that it need not make the values
//
// The reply may be kept as long as the session likes and called on any thread. It holds the outbox weakly: of a
// connection that has ended meanwhile nothing is kept alive, and the answer goes nowhere.

namespace orvanta {
using platform::Frame;
using platform::MessagePackWriter;
using platform::Outbox;

namespace {

// Takes checked arguments out of the frame, in order; dictionaries and arrays are moved, not copied.
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

// The values of each kind of reply, as RemoteResponses.cpp reads them.
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

// The reply for the frame: empty for a notification.
template <class AnyReply>
AnyReply makeReply(const Frame& frame, const std::shared_ptr<Outbox>& outbox) {
  if (frame.kind != Frame::Kind::request) return {};
  using Outcome = typename AnyReply::Outcome;
  return AnyReply([weak = std::weak_ptr<Outbox>(outbox), id = frame.messageID](Outcome outcome) {
    const auto live = weak.lock();
    if (!live) return;
    std::vector<std::uint8_t> message;
    message.reserve(64);
    if (outcome.values) {
      platform::appendResponseHeader(message, id);
      MessagePackWriter out(message);
      out.nil();
      std::apply(
          [&out](const auto&... values) {
            out.arrayHeader(sizeof...(values));
            (write(out, values), ...);
          },
          *outcome.values);
    } else {
      platform::appendErrorResponse(message, id, outcome.error.text);
    }
    live->send(message);
  });
}

void refuse(const Frame& frame, const std::shared_ptr<Outbox>& outbox, std::string_view reason) {
  if (frame.kind == Frame::Kind::request) {
    std::vector<std::uint8_t> message;
    platform::appendErrorResponse(message, frame.messageID, reason);
    outbox->send(message);
  }
  ORVANTA_LOG(info, "dispatchCall: Refused a call of '{}': {}", frame.method, reason);
}

// Takes the arguments out of a frame that checkArguments() has passed, and calls the operation.
void call(RemoteCallID id, Frame& frame, ClientSessionInterface& target, const std::shared_ptr<Outbox>& outbox) {
  ArgumentReader in(frame.params);
  switch (id) {
    case RemoteCallID::setSessionInfo: {
      auto sessionInfo = in.dictionary();
      auto userInfo = in.dictionary();
      auto frameworks = in.array();
      const bool hasAggregationBlock = in.boolean();
      return target.setSessionInfo(std::move(sessionInfo), std::move(userInfo), std::move(frameworks),
                                   hasAggregationBlock, makeReply<DoneReply>(frame, outbox));
    }
    case RemoteCallID::startConfigWithCompletionHandler:
      return target.startConfigWithCompletionHandler(makeReply<BackendNamesReply>(frame, outbox));
    case RemoteCallID::fetchStatesWithUserInfo:
      return target.fetchStatesWithUserInfo(in.dictionary(), makeReply<BackendNamesReply>(frame, outbox));
    case RemoteCallID::fetchDisplayURL:
      return target.fetchDisplayURL(makeReply<StringReply>(frame, outbox));
    case RemoteCallID::sendMessageWithCategory: {
      const auto category = in.uint16();
      const auto type = in.uint16();
      return target.sendMessageWithCategory(category, type, in.dictionary(), makeReply<StringReply>(frame, outbox));
    }
    case RemoteCallID::sendMessageWithDictionary:
      return target.sendMessageWithDictionary(in.dictionary(), makeReply<StringReply>(frame, outbox));
    case RemoteCallID::flushMessagesWithCompletion:
      return target.flushMessagesWithCompletion(makeReply<FlushReply>(frame, outbox));
    case RemoteCallID::finishSessionWithReply:
      return target.finishSessionWithReply(makeReply<StringReply>(frame, outbox));
    case RemoteCallID::uploadFileAtPath: {
      auto url = in.string();
      auto token = in.stringOrNil();
      return target.uploadFileAtPath(std::move(url), std::move(token), makeReply<UploadReply>(frame, outbox));
    }
    case RemoteCallID::uploadLogData:
      return target.uploadLogData(in.array(), makeReply<LogDataReply>(frame, outbox));
    case RemoteCallID::sendMessageWithSessionInfo: {
      auto sessionInfo = in.dictionary();
      auto userInfo = in.dictionary();
      const auto category = in.uint16();
      const auto type = in.uint16();
      return target.sendMessageWithSessionInfo(std::move(sessionInfo), std::move(userInfo), category, type,
                                               in.dictionary(), makeReply<StringReply>(frame, outbox));
    }
  }
}

}  // namespace

bool dispatchCall(Frame&& frame, ClientSessionInterface& target, const std::shared_ptr<Outbox>& outbox) {
  if (frame.refusal) {
    refuse(frame, outbox, *frame.refusal);
    return false;
  }
  const auto id = findRemoteCall(frame.method);
  if (!id) {
    refuse(frame, outbox,
           fmt::format("unknown method '{}'", std::string_view(frame.method).substr(0, kMaximumMethodInRefusal)));
    return false;
  }
  if (const auto problem = checkArguments(remoteCall(*id), frame.params)) {
    refuse(frame, outbox, *problem);
    return false;
  }
  call(*id, frame, target, outbox);
  return true;
}

}  // namespace orvanta
