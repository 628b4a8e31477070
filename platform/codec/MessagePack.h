#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/core/Result.h"
#include "platform/core/Value.h"

namespace orvanta::platform {

// The limits of a decoder. Depth counts the outermost array; `maximumCharge` bounds what the decoded values take in
// memory, so that a small message cannot become a large one.
struct MessagePackLimits {
  std::size_t maximumDepth = 0;
  std::size_t maximumCharge = 0;
};

// Appends MessagePack to a byte buffer. Integers take their shortest form, doubles float64, dates the shortest
// timestamp extension. Never fails.
class MessagePackWriter {
 public:
  explicit MessagePackWriter(std::vector<std::uint8_t>& out) : _out(out) {}

  void nil();
  void boolean(bool v);
  void integer(std::int64_t v);
  void unsignedInteger(std::uint64_t v);
  void real(double v);
  void string(std::string_view v);
  void data(std::span<const std::uint8_t> v);
  void date(double secondsSince1970);
  void arrayHeader(std::size_t count);
  void mapHeader(std::size_t count);
  void value(const Value& v);
  void dictionary(const Dictionary& v);
  void array(const Array& v);

 private:
  std::vector<std::uint8_t>& _out;
};

// Decodes exactly one value that fills `bytes`. Refuses, with the offset: truncated or trailing bytes, unknown
// extension types, map keys that are not text, duplicate keys, text that is not UTF-8, anything over the limits.
Result<Value> decodeMessagePack(std::span<const std::uint8_t> bytes, const MessagePackLimits& limits);

}  // namespace orvanta::platform
