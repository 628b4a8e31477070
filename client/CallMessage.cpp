#include "client/CallMessage.h"

#include <fmt/format.h>

#include <algorithm>
#include <cassert>
#include <variant>

#include "platform/codec/MessagePack.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/FrameDecoder.h"

namespace orvanta {
using platform::MessagePackWriter;

namespace {

// The frame's own array and that of its arguments stand around every argument.
constexpr std::size_t kArgumentDepth = kMaximumFrameDepth - 2;

// Below this no message can be charged more than kMaximumFrameCharge: a byte on the wire is charged at most one Value,
// everything included.
constexpr std::size_t kHarmlessBytes = kMaximumFrameCharge / 128;

constexpr std::size_t kBufferKept = 1U << 20U;

std::vector<std::uint8_t>& threadBuffer() {
  thread_local std::vector<std::uint8_t> buffer;
  return buffer;
}

bool fits(const Dictionary& value, std::size_t levels);
bool fits(const Array& value, std::size_t levels);

// Returns whether a value's containers nest at most `levels` deep.
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

CallMessage::CallMessage(RemoteCallID id, std::optional<std::uint32_t> messageID)
    : _bytes(threadBuffer()), _call(remoteCall(id)) {
  _bytes.clear();
  if (messageID) {
    platform::appendRequestHeader(_bytes, *messageID, _call.method, _call.arguments.size());
  } else {
    platform::appendNotificationHeader(_bytes, _call.method, _call.arguments.size());
  }
}

CallMessage::~CallMessage() {
  if (_bytes.capacity() > kBufferKept) std::vector<std::uint8_t>().swap(_bytes);
}

CallMessage& CallMessage::dictionary(const SharedDictionary& value) {
  auto out = nextArgument();
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
  auto out = nextArgument();
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
  nextArgument().boolean(value);
  return *this;
}

CallMessage& CallMessage::number(std::uint16_t value) {
  nextArgument().unsignedInteger(value);
  return *this;
}

CallMessage& CallMessage::text(std::string_view value) {
  nextArgument().string(value);
  return *this;
}

CallMessage& CallMessage::optionalText(const std::optional<std::string>& value) {
  if (value) return text(*value);
  nextArgument().nil();
  return *this;
}

MessagePackWriter CallMessage::nextArgument() {
  assert(_given < _call.arguments.size());
  ++_given;
  return MessagePackWriter(_bytes);
}

std::optional<std::string> CallMessage::problem() const {
  assert(_given == _call.arguments.size());
  if (_tooDeep) {
    return fmt::format("{}: the values nest deeper than {} levels", _call.method, kArgumentDepth);
  }
  if (_bytes.size() > kMaximumFrameBytes) {
    return fmt::format("{}: the call takes {} bytes, the limit is {}", _call.method, _bytes.size(), kMaximumFrameBytes);
  }
  if (_bytes.size() > kHarmlessBytes) {
    // Rare enough to let the decoder that the daemon uses decide beforehand.
    platform::FrameDecoder decoder(kFrameLimits);
    decoder.append(_bytes);
    const auto outcome = decoder.next();
    if (const auto* error = std::get_if<platform::FrameDecoder::ProtocolError>(&outcome)) {
      return fmt::format("{}: {}", _call.method, error->text);
    }
  }
  return std::nullopt;
}

}  // namespace orvanta
