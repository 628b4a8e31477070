#include "platform/ipc/FrameDecoder.h"

#include <algorithm>
#include <limits>
#include <utility>

#include <fmt/format.h>

#include "platform/codec/MessagePackReader.h"

namespace orvanta::platform {

namespace {

using Kind = MessagePackHead::Kind;

// Room that an idle decoder keeps; what a large frame or a burst needed beyond it is given back.
constexpr std::size_t kKeptCapacity = 8U << 10U;

// The beginning of a frame: what must be right for it to be a frame at all.
bool readShape(MessagePackReader& reader, Frame& frame) {
  MessagePackHead outer;
  MessagePackHead type;
  if (!reader.head(outer)) return false;
  if (outer.kind != Kind::array || (outer.argument != 3 && outer.argument != 4)) {
    return reader.fail(0, "no array of three or four elements");
  }
  // How many of the elements have arrived does not matter here: value() looks to that.
  const bool whole = reader.enter(outer);
  if (!reader.failure().empty() || !reader.head(type)) return false;
  if (type.kind != Kind::unsignedInteger || type.argument > 2) {
    return reader.fail(1, "a message type other than 0, 1 or 2");
  }
  frame.kind = type.argument == 0   ? Frame::Kind::request
               : type.argument == 1 ? Frame::Kind::response
                                    : Frame::Kind::notification;
  if (outer.argument != (frame.kind == Frame::Kind::notification ? 3U : 4U)) {
    return reader.fail(0, fmt::format("a message of type {} with {} elements", type.argument, outer.argument));
  }

  if (frame.kind != Frame::Kind::notification) {
    const std::size_t offset = reader.offset();
    MessagePackHead id;
    if (!reader.head(id)) return false;
    if (id.kind != Kind::unsignedInteger || !std::in_range<std::uint32_t>(id.argument)) {
      return reader.fail(offset, "a message id that is no unsigned 32-bit number");
    }
    frame.messageID = static_cast<std::uint32_t>(id.argument);
  }
  if (frame.kind != Frame::Kind::response) {
    const std::size_t offset = reader.offset();
    MessagePackHead method;
    std::string_view name;
    if (!reader.head(method)) return false;
    if (method.kind != Kind::string) return reader.fail(offset, "a method name that is no text");
    if (!reader.text(method, name)) return false;
    frame.method.assign(name);
  }
  return whole;
}

bool readParams(MessagePackReader& reader, Array& params) {
  const std::size_t offset = reader.offset();
  MessagePackHead head;
  if (!reader.head(head)) return false;
  if (head.kind == Kind::array) return reader.array(head, params);
  reader.refuse(offset, "params that are no array");
  Value ignored;
  return reader.valueAfter(head, ignored);
}

bool readFrame(MessagePackReader& reader, Frame& frame) {
  if (!readShape(reader, frame)) return false;
  if (frame.kind == Frame::Kind::response) return reader.value(frame.error) && reader.value(frame.result);
  return readParams(reader, frame.params);
}

}  // namespace

FrameDecoder::FrameDecoder(FrameLimits limits) : _limits(limits) {}

void FrameDecoder::append(std::span<const std::uint8_t> bytes) {
  if (_failed) return;
  // Moving what is left to the front costs no more than what was consumed before.
  if (_start > 0 && _start >= pending()) {
    _buffer.erase(_buffer.begin(), _buffer.begin() + static_cast<std::ptrdiff_t>(_start));
    _start = 0;
  }
  _buffer.insert(_buffer.end(), bytes.begin(), bytes.end());
}

FrameDecoder::Outcome FrameDecoder::next() {
  if (_failed) return ProtocolError{*_failed};
  if (pending() == 0) return NeedMore{};
  if (!_scan.active) {
    Outcome outcome = decode(unread().first(std::min(pending(), _limits.maximumFrame)));
    if (!std::holds_alternative<NeedMore>(outcome)) return outcome;
    _scan.active = true;
    _scan.owed = 1;
    _scan.remaining.assign(1, 1);
  }
  switch (scanOn()) {
    case Progress::incomplete:
      return NeedMore{};
    case Progress::failed:
      return ProtocolError{*_failed};
    case Progress::complete:
      break;
  }
  Outcome outcome = decode(unread().first(_scan.offset));
  if (std::holds_alternative<NeedMore>(outcome)) return fail("a frame that ends before its last value");
  return outcome;
}

FrameDecoder::Outcome FrameDecoder::decode(std::span<const std::uint8_t> window) {
  Outcome outcome(std::in_place_type<Frame>);
  Frame& frame = std::get<Frame>(outcome);
  MessagePackReader reader(window, {_limits.maximumDepth, _limits.maximumCharge});
  if (!readFrame(reader, frame)) {
    if (!reader.failure().empty()) return fail(reader.failure());
    outcome = NeedMore{};
    return outcome;
  }
  frame.refusal = std::move(reader.refusal());
  frame.wireSize = reader.offset();
  frame.charge = sizeof(Frame) + reader.charge();
  if (frame.refusal) {
    // The params that could be read stay: they tell whether a descriptor came with the call.
    frame.error = Value();
    frame.result = Value();
  }
  consume(reader.offset());
  return outcome;
}

FrameDecoder::Progress FrameDecoder::scanOn() {
  if (!_scan.shapeSeen) {
    MessagePackReader reader(unread(), {_limits.maximumDepth, _limits.maximumCharge});
    Frame frame;
    _scan.shapeSeen = readShape(reader, frame);
    if (!reader.failure().empty()) {
      fail(reader.failure());
      return Progress::failed;
    }
  }
  return scanStructure();
}

FrameDecoder::Progress FrameDecoder::scanStructure() {
  const std::span<const std::uint8_t> bytes = unread();
  while (!_scan.remaining.empty()) {
    if (_scan.offset + _scan.owed > _limits.maximumFrame) {
      fail(fmt::format("a frame of more than {} bytes", _limits.maximumFrame));
      return Progress::failed;
    }
    if (_scan.offset >= bytes.size()) return Progress::incomplete;
    const MessagePackHead head = readMessagePackHead(bytes.subspan(_scan.offset));
    if (head.kind == Kind::truncated) return Progress::incomplete;
    if (head.kind == Kind::invalid) {
      fail(fmt::format("a byte that begins no MessagePack value at byte {}", _scan.offset));
      return Progress::failed;
    }
    // Limits are looked at in the reader's order: the same error comes out however the bytes arrive.
    _scan.charge += memoryCharge(head);
    if (_scan.charge > _limits.maximumCharge) {
      fail(
          fmt::format("values that take more than {} bytes in memory at byte {}", _limits.maximumCharge, _scan.offset));
      return Progress::failed;
    }
    if ((head.kind == Kind::array || head.kind == Kind::map) && _scan.remaining.size() > _limits.maximumDepth) {
      fail(fmt::format("nesting deeper than {} at byte {}", _limits.maximumDepth, _scan.offset));
      return Progress::failed;
    }
    _scan.offset += head.size + (head.hasBody() ? head.argument : 0);
    --_scan.owed;
    --_scan.remaining.back();
    if (const std::uint64_t elements = head.elements(); elements > 0) {
      _scan.owed += elements;
      _scan.remaining.push_back(elements);
    }
    while (!_scan.remaining.empty() && _scan.remaining.back() == 0) _scan.remaining.pop_back();
  }
  if (_scan.offset > _limits.maximumFrame) {
    fail(fmt::format("a frame of more than {} bytes", _limits.maximumFrame));
    return Progress::failed;
  }
  return _scan.offset <= bytes.size() ? Progress::complete : Progress::incomplete;
}

FrameDecoder::Outcome FrameDecoder::fail(std::string text) {
  _failed = std::move(text);
  _buffer = {};
  _start = 0;
  _scan = {};
  return ProtocolError{*_failed};
}

void FrameDecoder::consume(std::size_t bytes) {
  _start += bytes;
  _scan.active = false;
  _scan.shapeSeen = false;
  _scan.offset = 0;
  _scan.charge = 0;
  if (pending() > 0) return;
  _start = 0;
  if (_buffer.capacity() > kKeptCapacity) {
    std::vector<std::uint8_t>().swap(_buffer);  // assigning {} would keep the room
  } else {
    _buffer.clear();
  }
}

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
