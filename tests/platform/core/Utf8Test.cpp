#include "platform/core/Utf8.h"

#include <gtest/gtest.h>

namespace orvanta::platform {
namespace {

TEST(Utf8, TellsValidFromMalformed) {
  const std::string_view valid[] = {"plain",           "\x7f",         "\xc2\x80",     "\xdf\xbf",
                                    "\xe0\xa0\x80",    "\xed\x9f\xbf", "\xee\x80\x80", "\xf0\x90\x80\x80",
                                    "\xf4\x8f\xbf\xbf"};
  // Continuations alone; overlong; surrogates and more than U+10FFFF; cut short, or broken off by another character.
  const std::string_view malformed[] = {
      "\x80",         "\xbf",         "\xc0\x80",         "\xc1\xbf",         "\xe0\x9f\xbf", "\xf0\x8f\xbf\xbf",
      "\xed\xa0\x80", "\xed\xbf\xbf", "\xf4\x90\x80\x80", "\xf5\x80\x80\x80", "\xff",         "\xc3",
      "\xe2\x82",     "\xf0\x9d\x84", "\xe2\x82\x41"};
  // Fast paths look at words of eight bytes: every place within and across them has to find the same.
  const auto expectEverywhere = [](std::string_view text, bool expected) {
    for (std::size_t i = 0; i < 18 * 18; ++i) {
      const std::string before(i / 18, 'a'), after(i % 18, 'z');
      EXPECT_EQ(isValidUtf8(before + std::string(text) + after), expected) << i << " " << testing::PrintToString(text);
      EXPECT_EQ(isValidUtf8(before + "é" + after + std::string(text)), expected);
    }
  };
  expectEverywhere({"\0", 1}, true);
  for (const std::string_view text : valid) expectEverywhere(text, true);
  for (const std::string_view text : malformed) expectEverywhere(text, false);
}

}  // namespace
}  // namespace orvanta::platform
