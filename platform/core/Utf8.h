#pragma once

#include <cstddef>
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

}  // namespace orvanta::platform
