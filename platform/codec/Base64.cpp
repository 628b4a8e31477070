#include <array>
#include <cstdint>

#include "platform/codec/PropertyList.h"

namespace orvanta::platform {

namespace {

constexpr std::string_view kAlphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr std::uint8_t kOutside = 0xff;

constexpr std::array<std::uint8_t, 256> makeDigits() {
  std::array<std::uint8_t, 256> digits{};
  for (auto& digit : digits) digit = kOutside;
  for (std::size_t i = 0; i < kAlphabet.size(); ++i) {
    digits[static_cast<unsigned char>(kAlphabet[i])] = static_cast<std::uint8_t>(i);
  }
  return digits;
}
constexpr std::array<std::uint8_t, 256> kDigits = makeDigits();

}  // namespace

std::string encodeBase64(std::span<const std::uint8_t> bytes) {
  std::string text;
  text.reserve((bytes.size() + 2) / 3 * 4);
  for (std::size_t i = 0; i < bytes.size(); i += 3) {
    const std::size_t count = bytes.size() - i < 3 ? bytes.size() - i : 3;
    std::uint32_t group = static_cast<std::uint32_t>(bytes[i]) << 16U;
    if (count > 1) group |= static_cast<std::uint32_t>(bytes[i + 1]) << 8U;
    if (count > 2) group |= bytes[i + 2];
    text += kAlphabet[group >> 18U];
    text += kAlphabet[(group >> 12U) & 0x3fU];
    text += count > 1 ? kAlphabet[(group >> 6U) & 0x3fU] : '=';
    text += count > 2 ? kAlphabet[group & 0x3fU] : '=';
  }
  return text;
}

std::optional<std::vector<std::uint8_t>> decodeBase64(std::string_view text) {
  std::vector<std::uint8_t> bytes;
  bytes.reserve(text.size() / 4 * 3 + 2);
  std::uint32_t bits = 0;
  unsigned held = 0;  // bits not yet given out
  bool padded = false;
  for (const char c : text) {
    if (c == '=') {
      padded = true;
      continue;
    }
    const std::uint8_t digit = kDigits[static_cast<unsigned char>(c)];
    if (digit == kOutside) continue;
    if (padded) return std::nullopt;
    bits = bits << 6U | digit;
    held += 6;
    if (held >= 8) {
      held -= 8;
      bytes.push_back(static_cast<std::uint8_t>(bits >> held));
    }
  }
  // A lone character leaves six bits, which make no byte.
  if (held == 6) return std::nullopt;
  return bytes;
}

}  // namespace orvanta::platform
