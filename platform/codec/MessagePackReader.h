#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/codec/MessagePack.h"
#include "platform/codec/MessagePackHead.h"
#include "platform/core/Value.h"

namespace orvanta::platform {

// Reads MessagePack out of one byte range, value by value, within limits. Lives on the stack of the function that has
// the bytes.
//
// Every operation returns whether it succeeded; after a false the reader is of no more use. Then either the bytes end
// too early (`failure()` is empty) or they break a rule or limit. A well-formed value that is not accepted (an unknown
// extension, a duplicate key, …) does not stop the reading: the first one is noted in `refusal()`.
class MessagePackReader {
 public:
  MessagePackReader(std::span<const std::uint8_t> bytes, const MessagePackLimits& limits)
      : _bytes(bytes), _limits(limits) {}

  // The head of the outermost value or of the next announced element. The caller then reads what belongs to it.
  bool head(MessagePackHead& head) {
    head = readMessagePackHead({here(), left()});
    if (head.kind == MessagePackHead::Kind::truncated) return false;
    if (head.kind == MessagePackHead::Kind::invalid) return failInvalid();
    _charge += memoryCharge(head);
    if (_charge > _limits.maximumCharge) return failCharge();
    _offset += head.size;
    --_owed;
    return true;
  }
  // The body of a string. Text that is not UTF-8 is refused and comes out empty.
  bool text(const MessagePackHead& head, std::string_view& text);
  // Announces the elements of an array or map whose head the caller has read; they are then read one by one.
  bool enter(const MessagePackHead& head);
  void leave() { --_depth; }
  bool value(Value& out);
  bool array(const MessagePackHead& head, Array& out);
  // Reads the value that `head`, read already, begins.
  bool valueAfter(const MessagePackHead& head, Value& out);

  void refuse(std::size_t offset, std::string_view what);
  bool fail(std::size_t offset, std::string_view what);

  std::size_t offset() const { return _offset; }
  std::size_t charge() const { return _charge; }
  bool atEnd() const { return _offset == _bytes.size(); }
  const std::string& failure() const { return _failure; }
  std::optional<std::string>& refusal() { return _refusal; }

 private:
  bool failCharge();
  bool failInvalid();
  bool map(const MessagePackHead& head, Value& out);
  bool mapEntry(Dictionary::Entry& entry);
  bool extension(const MessagePackHead& head, Value& out);
  void refuseDuplicate(std::size_t offset, const std::vector<Dictionary::Entry>& entries);
  std::size_t left() const { return _bytes.size() - _offset; }
  const std::uint8_t* here() const { return _bytes.data() + _offset; }

  const std::span<const std::uint8_t> _bytes;
  const MessagePackLimits _limits;
  std::size_t _offset = 0;
  std::size_t _depth = 0;
  std::uint64_t _owed = 1;  // values announced and not yet begun: each will take a byte at least
  std::size_t _charge = 0;
  std::string _failure;
  std::optional<std::string> _refusal;
};

}  // namespace orvanta::platform
