#include "platform/codec/MessagePack.h"
#include "platform/ipc/Connection.h"

namespace orvanta::platform {

void appendRequestHeader(std::vector<std::uint8_t>& out, std::uint32_t messageID, std::string_view method,
                         std::size_t paramCount) {
  MessagePackWriter writer(out);
  writer.arrayHeader(4);
  writer.unsignedInteger(0);
  writer.unsignedInteger(messageID);
  writer.string(method);
  writer.arrayHeader(paramCount);
}

void appendNotificationHeader(std::vector<std::uint8_t>& out, std::string_view method, std::size_t paramCount) {
  MessagePackWriter writer(out);
  writer.arrayHeader(3);
  writer.unsignedInteger(2);
  writer.string(method);
  writer.arrayHeader(paramCount);
}

void appendResponseHeader(std::vector<std::uint8_t>& out, std::uint32_t messageID) {
  MessagePackWriter writer(out);
  writer.arrayHeader(4);
  writer.unsignedInteger(1);
  writer.unsignedInteger(messageID);
}

void appendErrorResponse(std::vector<std::uint8_t>& out, std::uint32_t messageID, std::string_view text) {
  appendResponseHeader(out, messageID);
  MessagePackWriter writer(out);
  writer.string(text);
  writer.nil();
}

}  // namespace orvanta::platform
