#include <utility>

#include "interface/RemoteCalls.h"
#include "platform/codec/MessagePack.h"

// The two notifications from the daemon to its client, both sides: the daemon writes them, the client reads them.

namespace orvanta {
using platform::Frame;
using platform::MessagePackWriter;

namespace {

// Begins a notification; its arguments follow.
std::vector<std::uint8_t> begun(RemoteNotificationID id, std::size_t size) {
  const auto& notification = remoteNotification(id);
  std::vector<std::uint8_t> message;
  message.reserve(size);
  platform::appendNotificationHeader(message, notification.method, notification.arguments.size());
  return message;
}

void writeDictionaryOrNil(MessagePackWriter& out, const SharedDictionary& value) {
  if (value) {
    out.dictionary(*value);
  } else {
    out.nil();
  }
}

// Returns whether the frame is that notification, whole and with the right arguments.
bool is(RemoteNotificationID id, const Frame& frame) {
  const auto& notification = remoteNotification(id);
  return frame.kind == Frame::Kind::notification && frame.method == notification.method && !frame.refusal &&
         !checkArguments(notification, frame.params);
}

SharedDictionary takeDictionaryOrNil(Value& value) {
  auto* held = value.dictionary();
  return held == nullptr ? nullptr : std::make_shared<const Dictionary>(std::move(*held));
}

}  // namespace

std::vector<std::uint8_t> encodeSendMessageToClient(const SharedDictionary& sessionInfo, double timestamp,
                                                    std::uint16_t category, std::uint16_t type,
                                                    const SharedDictionary& payload) {
  auto message = begun(RemoteNotificationID::sendMessageToClient, 256);
  MessagePackWriter out(message);
  writeDictionaryOrNil(out, sessionInfo);
  out.real(timestamp);
  out.unsignedInteger(category);
  out.unsignedInteger(type);
  writeDictionaryOrNil(out, payload);
  return message;
}

std::vector<std::uint8_t> encodeRemoveFile(std::string_view token) {
  auto message = begun(RemoteNotificationID::removeFile, 64);
  MessagePackWriter(message).string(token);
  return message;
}

std::optional<AggregatedEvent> decodeSendMessageToClient(Frame& frame) {
  if (!is(RemoteNotificationID::sendMessageToClient, frame)) return std::nullopt;
  auto& params = frame.params;
  AggregatedEvent event;
  event.sessionInfo = takeDictionaryOrNil(params[0]);
  event.timestamp = params[1].doubleValue();
  event.category = static_cast<std::uint16_t>(params[2].integerValue());
  event.type = static_cast<std::uint16_t>(params[3].integerValue());
  event.payload = takeDictionaryOrNil(params[4]);
  return event;
}

std::optional<std::string> decodeRemoveFile(const Frame& frame) {
  if (!is(RemoteNotificationID::removeFile, frame)) return std::nullopt;
  return *frame.params[0].string();
}

}  // namespace orvanta
