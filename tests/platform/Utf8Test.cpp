#include "platform/Utf8.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

TEST(Utf8, TellsValidFromMalformed) {
  const std::pair<std::string_view, bool> rows[] = {
      {"", true},
      {"plain", true},
      {std::string_view("\0", 1), true},
      {"\x7f", true},
      {"\xc2\x80", true},
      {"\xdf\xbf", true},
      {"\xe0\xa0\x80", true},
      {"\xed\x9f\xbf", true},
      {"\xee\x80\x80", true},
      {"\xf0\x90\x80\x80", true},
      {"\xf4\x8f\xbf\xbf", true},
      {"\x80", false},  // continuation alone
      {"\xbf", false},
      {"\xc0\x80", false},  // overlong
      {"\xc1\xbf", false},
      {"\xe0\x9f\xbf", false},
      {"\xf0\x8f\xbf\xbf", false},
      {"\xed\xa0\x80", false},  // surrogate
      {"\xed\xbf\xbf", false},
      {"\xf4\x90\x80\x80", false},  // above U+10FFFF
      {"\xf5\x80\x80\x80", false},
      {"\xff", false},
      {"\xc3", false},  // cut short
      {"\xe2\x82", false},
      {"\xf0\x9d\x84", false},
      {"\xe2\x82\x41", false},  // broken off by another character
  };
  for (const auto& [text, expected] : rows) {
    // Fast paths look at words of eight bytes: every place within and across them has to find the same.
    for (std::size_t before = 0; before < 18; ++before) {
      for (std::size_t after = 0; after < 18; ++after) {
        const std::string padded = std::string(before, 'a') + std::string(text) + std::string(after, 'z');
        EXPECT_EQ(isValidUtf8(padded), expected) << before << " " << after << " " << testing::PrintToString(text);
        const std::string afterAccent = std::string(before, 'a') + "é" + std::string(after, 'z') + std::string(text);
        EXPECT_EQ(isValidUtf8(afterAccent), expected);
      }
    }
  }
}

TEST(Utf8, WritesWhatItReads) {
  for (const char32_t codePoint :
       {0x0U, 0x7fU, 0x80U, 0x7ffU, 0x800U, 0xd7ffU, 0xe000U, 0xffffU, 0x10000U, 0x10ffffU}) {
    std::string text;
    appendUtf8(text, codePoint);
    const Utf8Character character = firstUtf8Character(text);
    EXPECT_TRUE(character.valid);
    EXPECT_EQ(character.codePoint, codePoint);
    EXPECT_EQ(character.length, text.size());
  }
}

}  // namespace
}  // namespace platform
