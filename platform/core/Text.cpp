#include "platform/core/Text.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstddef>
#include <numeric>
#include <system_error>
#include <utility>
#include <vector>

namespace orvanta::platform {

namespace {

constexpr std::string_view kUpperDigits = "0123456789ABCDEF";
constexpr std::string_view kLowerDigits = "0123456789abcdef";

char lowered(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

// The value of a hexadecimal digit; -1 for another character.
int digitValue(char c) {
  const auto at = kLowerDigits.find(lowered(c));
  return at == std::string_view::npos ? -1 : static_cast<int>(at);
}

constexpr std::size_t kLongestWord = 64;  // longer ones resemble nothing

std::size_t editDistance(std::string_view a, std::string_view b) {
  std::vector<std::size_t> row(b.size() + 1);
  std::iota(row.begin(), row.end(), std::size_t{0});
  for (std::size_t i = 0; i < a.size(); ++i) {
    std::size_t diagonal = std::exchange(row[0], i + 1);
    for (std::size_t j = 0; j < b.size(); ++j) {
      const std::size_t replaced = diagonal + (a[i] == b[j] ? 0 : 1);
      diagonal = row[j + 1];
      row[j + 1] = std::min({replaced, row[j] + 1, diagonal + 1});
    }
  }
  return row.back();
}

}  // namespace

bool equalsIgnoringCase(std::string_view a, std::string_view b) {
  return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](char x, char y) { return lowered(x) == lowered(y); });
}

std::string hexText(std::span<const std::uint8_t> bytes) {
  std::string text;
  text.reserve(bytes.size() * 2);
  for (const std::uint8_t byte : bytes) {
    text += kLowerDigits[byte >> 4U];
    text += kLowerDigits[byte & 0xFU];
  }
  return text;
}

std::string hexText(std::string_view bytes) {
  return hexText(std::span(reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()));
}

std::string errnoText(int error) {
  return std::generic_category().message(error);
}

std::string percentEncode(std::string_view text, bool (*keeps)(char)) {
  std::string encoded;
  encoded.reserve(text.size());
  for (const char c : text) {
    if (keeps(c)) {
      encoded += c;
      continue;
    }
    const auto byte = static_cast<unsigned char>(c);
    encoded += '%';
    encoded += kUpperDigits[byte >> 4U];
    encoded += kUpperDigits[byte & 0xFU];
  }
  return encoded;
}

std::string percentDecode(std::string_view text) {
  std::string decoded;
  decoded.reserve(text.size());
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '%' && i + 2 < text.size()) {
      const int high = digitValue(text[i + 1]);
      const int low = digitValue(text[i + 2]);
      if (high >= 0 && low >= 0) {
        decoded += static_cast<char>(high * 16 + low);
        i += 2;
        continue;
      }
    }
    decoded += text[i];
  }
  return decoded;
}

std::string_view nearestWord(std::string_view word, std::span<const std::string_view> known) {
  word = word.substr(0, kLongestWord);
  return *std::min_element(known.begin(), known.end(), [&](std::string_view a, std::string_view b) {
    return editDistance(word, a) < editDistance(word, b);
  });
}

std::string describeUnknownKeys(const Dictionary& dictionary, std::span<const std::string_view> known) {
  std::string text;
  for (const auto& [key, value] : dictionary) {
    if (std::find(known.begin(), known.end(), key) != known.end()) continue;
    if (!text.empty()) text += "; ";
    text += fmt::format("unknown key \"{}\", did you mean \"{}\"?", key, nearestWord(key, known));
  }
  return text;
}

}  // namespace orvanta::platform
