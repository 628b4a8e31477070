#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace orvanta::platform {

// Returns whether `text` is UTF-8 throughout: no overlong forms, no surrogates, nothing above U+10FFFF.
bool isValidUtf8(std::string_view text);

// The first character of a text that is not empty: its bytes, or how many bytes are malformed together (what a decoder
// replaces with one U+FFFD).
struct Utf8Character {
  char32_t codePoint = 0;
  std::size_t length = 1;
  bool valid = false;
};
Utf8Character firstUtf8Character(std::string_view text);

// `codePoint` is a Unicode scalar value.
void appendUtf8(std::string& out, char32_t codePoint);

// Returns whether XML has a way to carry this character at all, be it as a reference.
bool isXmlCharacter(char32_t codePoint);
// Offset of the first thing in `text` that is not UTF-8 or not an XML character; nullopt when all is valid.
std::optional<std::size_t> findNonXmlCharacter(std::string_view text);

}  // namespace orvanta::platform
