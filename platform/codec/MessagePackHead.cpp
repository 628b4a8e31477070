#include "platform/codec/MessagePackHead.h"

#include <array>

namespace orvanta::platform {

MessagePackHead readLongMessagePackHead(std::span<const std::uint8_t> bytes) {
  using Kind = MessagePackHead::Kind;
  const std::uint8_t lead = bytes[0];
  if (lead < 0x90) return {Kind::map, 1, 0, lead & 0x0fU};
  if (lead < 0xa0) return {Kind::array, 1, 0, lead & 0x0fU};
  if (lead >= 0xe0) {
    return {Kind::integer, 1, 0, static_cast<std::uint64_t>(static_cast<std::int64_t>(static_cast<std::int8_t>(lead)))};
  }

  struct Form {
    Kind kind;
    std::uint8_t argumentBytes;
    std::uint8_t fixed;  // the argument where no bytes hold it
  };
  static constexpr std::array<Form, 32> kForms{{
      {Kind::nil, 0, 0},
      {Kind::invalid, 0, 0},
      {Kind::boolean, 0, 0},
      {Kind::boolean, 0, 1},
      {Kind::data, 1, 0},
      {Kind::data, 2, 0},
      {Kind::data, 4, 0},
      {Kind::extension, 1, 0},
      {Kind::extension, 2, 0},
      {Kind::extension, 4, 0},
      {Kind::shortReal, 4, 0},
      {Kind::real, 8, 0},
      {Kind::unsignedInteger, 1, 0},
      {Kind::unsignedInteger, 2, 0},
      {Kind::unsignedInteger, 4, 0},
      {Kind::unsignedInteger, 8, 0},
      {Kind::integer, 1, 0},
      {Kind::integer, 2, 0},
      {Kind::integer, 4, 0},
      {Kind::integer, 8, 0},
      {Kind::extension, 0, 1},
      {Kind::extension, 0, 2},
      {Kind::extension, 0, 4},
      {Kind::extension, 0, 8},
      {Kind::extension, 0, 16},
      {Kind::string, 1, 0},
      {Kind::string, 2, 0},
      {Kind::string, 4, 0},
      {Kind::array, 2, 0},
      {Kind::array, 4, 0},
      {Kind::map, 2, 0},
      {Kind::map, 4, 0},
  }};
  const Form& form = kForms[lead - 0xc0U];
  const std::size_t typeBytes = form.kind == Kind::extension ? 1 : 0;
  const std::size_t size = 1 + form.argumentBytes + typeBytes;
  if (bytes.size() < size) return {Kind::truncated, static_cast<std::uint8_t>(size), 0, 0};

  MessagePackHead head{form.kind, static_cast<std::uint8_t>(size), 0, form.fixed};
  if (form.argumentBytes != 0) head.argument = loadBigEndian(bytes.data() + 1, form.argumentBytes);
  if (typeBytes != 0) head.extensionType = static_cast<std::int8_t>(bytes[size - 1]);
  if (form.kind == Kind::integer) {
    const unsigned shift = 64U - 8U * form.argumentBytes;
    const std::int64_t number = static_cast<std::int64_t>(head.argument << shift) >> shift;
    head.argument = static_cast<std::uint64_t>(number);
    if (number >= 0) head.kind = Kind::unsignedInteger;
  }
  return head;
}

}  // namespace orvanta::platform
