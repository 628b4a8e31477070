#pragma once

#include <cstdint>
#include <span>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "platform/core/Text.h"

namespace orvanta::test {

// Bytes written down as hexadecimal digits, with blanks and line breaks anywhere, and texts in single quotes as they
// are: fromHex("a3 'abc' c0").
inline std::vector<std::uint8_t> fromHex(std::string_view text) {
  std::vector<std::uint8_t> bytes;
  int high = -1;
  bool quoted = false;
  for (const char c : text) {
    if (c == '\'') {
      quoted = !quoted;
    } else if (quoted) {
      bytes.push_back(static_cast<std::uint8_t>(c));
    } else if (c != ' ' && c != '\n') {
      constexpr std::string_view kDigits = "0123456789abcdef";
      const std::size_t digit = kDigits.find(c);
      if (digit == kDigits.npos) throw std::invalid_argument("no hexadecimal digit: " + std::string(text));
      if (high < 0) {
        high = static_cast<int>(digit);
      } else {
        bytes.push_back(static_cast<std::uint8_t>(high * 16 + static_cast<int>(digit)));
        high = -1;
      }
    }
  }
  if (high >= 0 || quoted) throw std::invalid_argument("half a byte or text: " + std::string(text));
  return bytes;
}

inline std::string toHex(std::span<const std::uint8_t> bytes) {
  std::string text;
  for (const std::uint8_t byte : bytes) {
    if (!text.empty()) text += ' ';
    text += platform::hexText(std::span(&byte, 1));
  }
  return text;
}

inline std::span<const std::uint8_t> bytesOf(std::string_view text) {
  return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

}  // namespace orvanta::test
