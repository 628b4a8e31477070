#include "client/CallMessage.h"

#include <fmt/format.h>

#include <algorithm>
#include <variant>

#include "interface/WireLimits.h"
#include "platform/codec/MessagePack.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/FrameDecoder.h"

namespace orvanta {
using platform::MessagePackWriter;

namespace {

// The frame's own array and that of its arguments stand around every argument.
constexpr std::size_t kArgumentDepth = kMaximumFrameDepth - 2;

// Below this no message can be charged more than kMaximumFrameCharge: one byte on the wire becomes at most one Value in
// memory, whatever else is accounted for it.
constexpr std::size_t kHarmlessBytes = kMaximumFrameCharge / 128;

constexpr std::size_t kBufferKept = 1U << 20U;

std::vector<std::uint8_t>& threadBuffer() {
  thread_local std::vector<std::uint8_t> buffer;
  return buffer;
}

bool fits(const Dictionary& value, std::size_t levels);
bool fits(const Array& value, std::size_t levels);

// Whether a value's containers nest at most `levels` deep.
bool fits(const Value& value, std::size_t levels) {
  if (const auto* held = value.dictionary()) return fits(*held, levels);
  if (const auto* held = value.array()) return fits(*held, levels);
  return true;
}
bool fits(const Dictionary& value, std::size_t levels) {
  return levels > 0 && std::all_of(value.begin(), value.end(),
                                   [levels](const auto& entry) { return fits(entry.second, levels - 1); });
}
bool fits(const Array& value, std::size_t levels) {
  return levels > 0 &&
         std::all_of(value.begin(), value.end(), [levels](const auto& entry) { return fits(entry, levels - 1); });
}

}  // namespace

CallMessage::CallMessage(std::string_view method, std::size_t argumentCount, std::optional<std::uint32_t> messageID)
    : _bytes(threadBuffer()), _method(method) {
  _bytes.clear();
  if (messageID) {
    platform::appendRequestHeader(_bytes, *messageID, method, argumentCount);
  } else {
    platform::appendNotificationHeader(_bytes, method, argumentCount);
  }
}

CallMessage::~CallMessage() {
  if (_bytes.capacity() > kBufferKept) std::vector<std::uint8_t>().swap(_bytes);
}

CallMessage& CallMessage::dictionary(const SharedDictionary& value) {
  MessagePackWriter out(_bytes);
  if (!value) {
    out.nil();
  } else if (fits(*value, kArgumentDepth)) {
    out.dictionary(*value);
  } else {
    _tooDeep = true;
  }
  return *this;
}

CallMessage& CallMessage::array(const SharedArray& value) {
  MessagePackWriter out(_bytes);
  if (!value) {
    out.nil();
  } else if (fits(*value, kArgumentDepth)) {
    out.array(*value);
  } else {
    _tooDeep = true;
  }
  return *this;
}

CallMessage& CallMessage::boolean(bool value) {
  MessagePackWriter(_bytes).boolean(value);
  return *this;
}

CallMessage& CallMessage::number(std::uint16_t value) {
  MessagePackWriter(_bytes).unsignedInteger(value);
  return *this;
}

CallMessage& CallMessage::text(std::string_view value) {
  MessagePackWriter(_bytes).string(value);
  return *this;
}

CallMessage& CallMessage::optionalText(const std::optional<std::string>& value) {
  if (value) return text(*value);
  MessagePackWriter(_bytes).nil();
  return *this;
}

std::optional<std::string> CallMessage::problem() const {
  if (_tooDeep) {
    return fmt::format("{}: the values nest deeper than {} levels", _method, kArgumentDepth);
  }
  if (_bytes.size() > kMaximumFrameBytes) {
    return fmt::format("{}: the call takes {} bytes, the limit is {}", _method, _bytes.size(), kMaximumFrameBytes);
  }
  if (_bytes.size() > kHarmlessBytes) {
    // Rare enough to let the daemon's own judge decide beforehand.
    platform::FrameDecoder decoder({kMaximumFrameBytes, kMaximumFrameCharge, kMaximumFrameDepth});
    decoder.append(_bytes);
    const auto outcome = decoder.next();
    if (const auto* error = std::get_if<platform::FrameDecoder::ProtocolError>(&outcome)) {
      return fmt::format("{}: {}", _method, error->text);
    }
  }
  return std::nullopt;
}

}  // namespace orvanta
