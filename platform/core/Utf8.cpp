#include "platform/core/Utf8.h"

#include <cstdint>
#include <cstring>

namespace orvanta::platform {

namespace {

constexpr std::uint64_t kHighBits = 0x8080808080808080U;

template <class Word>
Word load(const char* text) {
  Word word = 0;
  std::memcpy(&word, text, sizeof word);
  return word;
}

// Returns whether all of a text is ASCII. Overlapping words at the end spare a loop over single bytes.
bool isAscii(const char* text, std::size_t size) {
  if (size < sizeof(std::uint64_t)) {
    if (size >= sizeof(std::uint32_t)) {
      const auto both = load<std::uint32_t>(text) | load<std::uint32_t>(text + size - sizeof(std::uint32_t));
      return (both & kHighBits) == 0;
    }
    unsigned char all = 0;
    for (std::size_t i = 0; i < size; ++i) all |= static_cast<unsigned char>(text[i]);
    return (all & 0x80U) == 0;
  }
  std::size_t i = 0;
  for (; size - i > 2 * sizeof(std::uint64_t); i += 2 * sizeof(std::uint64_t)) {
    const auto both = load<std::uint64_t>(text + i) | load<std::uint64_t>(text + i + sizeof(std::uint64_t));
    if ((both & kHighBits) != 0) return false;
  }
  if (size - i > sizeof(std::uint64_t) && (load<std::uint64_t>(text + i) & kHighBits) != 0) return false;
  return (load<std::uint64_t>(text + size - sizeof(std::uint64_t)) & kHighBits) == 0;
}

// The longest run of whole ASCII words at the start.
std::size_t asciiWords(std::string_view text) {
  std::size_t i = 0;
  while (text.size() - i >= sizeof(std::uint64_t) && (load<std::uint64_t>(text.data() + i) & kHighBits) == 0) {
    i += sizeof(std::uint64_t);
  }
  return i;
}

}  // namespace

Utf8Character firstUtf8Character(std::string_view text) {
  const auto byte = [&text](std::size_t i) { return static_cast<unsigned char>(text[i]); };
  const unsigned lead = byte(0);
  if (lead < 0x80) return {lead, 1, true};
  // The second byte's range rules out overlong forms, surrogates and what lies above U+10FFFF.
  std::size_t length = 0;
  unsigned low = 0x80;
  unsigned high = 0xbf;
  char32_t codePoint = 0;
  if (lead >= 0xc2 && lead <= 0xdf) {
    length = 2;
    codePoint = lead & 0x1fU;
  } else if (lead >= 0xe0 && lead <= 0xef) {
    length = 3;
    codePoint = lead & 0x0fU;
    if (lead == 0xe0) low = 0xa0;
    if (lead == 0xed) high = 0x9f;
  } else if (lead >= 0xf0 && lead <= 0xf4) {
    length = 4;
    codePoint = lead & 0x07U;
    if (lead == 0xf0) low = 0x90;
    if (lead == 0xf4) high = 0x8f;
  } else {
    return {};
  }
  for (std::size_t i = 1; i < length; ++i) {
    if (i >= text.size() || byte(i) < low || byte(i) > high) return {0, i, false};
    codePoint = (codePoint << 6U) | (byte(i) & 0x3fU);
    low = 0x80;
    high = 0xbf;
  }
  return {codePoint, length, true};
}

bool isValidUtf8(std::string_view text) {
  if (isAscii(text.data(), text.size())) return true;
  while (!text.empty()) {
    text.remove_prefix(asciiWords(text));
    // The rest of this word, and on for as long as characters are not ASCII.
    std::size_t ascii = 0;
    while (!text.empty() && ascii < sizeof(std::uint64_t)) {
      const Utf8Character character = firstUtf8Character(text);
      if (!character.valid) return false;
      ascii = character.length == 1 ? ascii + 1 : 0;
      text.remove_prefix(character.length);
    }
  }
  return true;
}

void appendUtf8(std::string& out, char32_t codePoint) {
  const auto put = [&out](char32_t byte) { out += static_cast<char>(byte); };
  const auto putRest = [&](unsigned shift) { put(0x80U | ((codePoint >> shift) & 0x3fU)); };
  if (codePoint < 0x80) {
    put(codePoint);
  } else if (codePoint < 0x800) {
    put(0xc0U | codePoint >> 6U);
    putRest(0);
  } else if (codePoint < 0x10000) {
    put(0xe0U | codePoint >> 12U);
    putRest(6);
    putRest(0);
  } else {
    put(0xf0U | codePoint >> 18U);
    putRest(12);
    putRest(6);
    putRest(0);
  }
}

bool isXmlCharacter(char32_t codePoint) {
  if (codePoint < 0x20) return codePoint == '\t' || codePoint == '\n' || codePoint == '\r';
  if (codePoint >= 0xd800 && codePoint <= 0xdfff) return false;
  return codePoint != 0xfffe && codePoint != 0xffff && codePoint <= 0x10ffff;
}

std::optional<std::size_t> findNonXmlCharacter(std::string_view text) {
  std::size_t i = 0;
  while (i < text.size()) {
    const auto byte = static_cast<unsigned char>(text[i]);
    if (byte >= 0x20 && byte < 0x80) {
      ++i;
      continue;
    }
    const Utf8Character character = firstUtf8Character(text.substr(i));
    if (!character.valid || !isXmlCharacter(character.codePoint)) return i;
    i += character.length;
  }
  return std::nullopt;
}

}  // namespace orvanta::platform
