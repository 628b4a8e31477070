#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>

#include "platform/core/Value.h"

namespace orvanta::platform {

// The first bytes of one MessagePack value: its type and, by type, the number itself, the length of what follows or the
// count of elements.
struct MessagePackHead {
  enum class Kind : std::uint8_t {
    nil,
    boolean,
    unsignedInteger,  // not negative, in any form
    integer,          // negative; `argument` holds the two's complement
    real,             // `argument` holds the bits
    shortReal,        // float32, likewise
    string,
    data,
    array,
    map,        // `argument` counts pairs
    extension,  // `extensionType` holds the type
    invalid,
    truncated,  // `size` says how many bytes the head has
  };

  Kind kind = Kind::truncated;
  std::uint8_t size = 1;
  std::int8_t extensionType = 0;
  std::uint64_t argument = 0;

  bool hasBody() const { return kind == Kind::string || kind == Kind::data || kind == Kind::extension; }
  // Values that follow directly inside this one.
  std::uint64_t elements() const { return kind == Kind::array ? argument : kind == Kind::map ? argument * 2 : 0; }
};

// About how much memory a decoded value takes beyond the place that its container keeps for it.
inline std::size_t memoryCharge(const MessagePackHead& head) {
  constexpr std::size_t kInlineText = 15;     // longer texts have a block of their own
  constexpr std::size_t kBlockOverhead = 16;  // what the allocator adds to a block
  const auto block = [](std::size_t bytes) { return bytes == 0 ? 0 : bytes + kBlockOverhead; };
  switch (head.kind) {
    case MessagePackHead::Kind::string:
      return head.argument <= kInlineText ? 0 : block(head.argument + 1);
    case MessagePackHead::Kind::data:
      return block(head.argument);
    case MessagePackHead::Kind::array:
      return block(head.argument * sizeof(Value));
    case MessagePackHead::Kind::map:
      return block(head.argument * sizeof(Dictionary::Entry));
    default:
      return 0;
  }
}

// A big-endian number of 0, 1, 2, 4 or 8 bytes.
inline std::uint64_t loadBigEndian(const std::uint8_t* bytes, std::size_t count) {
  const auto load = [bytes]<class T>(T word) {
    std::memcpy(&word, bytes, sizeof word);
    return word;
  };
  switch (count) {
    case 1:
      return bytes[0];
    case 2:
      return __builtin_bswap16(load(std::uint16_t{}));
    case 4:
      return __builtin_bswap32(load(std::uint32_t{}));
    case 8:
      return __builtin_bswap64(load(std::uint64_t{}));
    default:
      return 0;
  }
}
static_assert(std::endian::native == std::endian::little, "loadBigEndian swaps bytes");

// The part of readMessagePackHead() for everything but short texts and small numbers. `bytes` is not empty.
MessagePackHead readLongMessagePackHead(std::span<const std::uint8_t> bytes);

// Never reads past `bytes`.
inline MessagePackHead readMessagePackHead(std::span<const std::uint8_t> bytes) {
  using Kind = MessagePackHead::Kind;
  if (bytes.empty()) return {};
  const std::uint8_t lead = bytes[0];
  if (lead < 0x80) return {Kind::unsignedInteger, 1, 0, lead};
  if (lead >= 0xa0 && lead < 0xc0) return {Kind::string, 1, 0, lead & 0x1fU};
  return readLongMessagePackHead(bytes);
}

}  // namespace orvanta::platform
