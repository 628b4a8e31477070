#include "platform/core/Text.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <memory>
#include <string>
#include <vector>

#include "platform/core/Result.h"
#include "platform/core/Utf8.h"

namespace orvanta::platform {
namespace {

TEST(Text, ComparesAsciiLettersIgnoringCase) {
  const struct {
    std::string_view a, b;
    bool equal;
  } rows[] = {
      {"", "", true},
      {"Content-Type", "content-TYPE", true},
      {"az", "AZ", true},
      {"12-_", "12-_", true},
      {"", "a", false},
      {"abc", "ab", false},
      {"abc", "abd", false},
      {"[", "{", false},  // beside the letters, and as far apart as "A" and "a"
      {"@", "`", false},
      {"\xc3\x84", "\xc3\xa4", false},
      {"k", "\xe2\x84\xaa", false},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(equalsIgnoringCase(row.a, row.b), row.equal) << row.a << " " << row.b;
    EXPECT_EQ(equalsIgnoringCase(row.b, row.a), row.equal) << row.b << " " << row.a;
  }
}

TEST(Text, WritesBytesAsHexadecimalDigits) {
  EXPECT_EQ(hexText(std::string_view()), "");
  EXPECT_EQ(hexText(std::string_view("\0\x01\x7f\x80\xff", 5)), "00017f80ff");
  EXPECT_EQ(hexText(std::vector<std::uint8_t>{0xde, 0xad, 0x0b}), "dead0b");
}

TEST(Text, NamesErrors) {
  EXPECT_EQ(errnoText(ENOENT), "No such file or directory");
  EXPECT_EQ(errnoText(EACCES), "Permission denied");
  EXPECT_EQ(errnoText(123456), "Unknown error 123456");
}

TEST(Text, PercentCodec) {
  const auto keeps = [](char c) { return c >= 'a' && c <= 'z'; };
  const struct {
    std::string_view plain, encoded;
  } rows[] = {{"", ""}, {"abc", "abc"}, {"a b", "a%20b"}, {"A%", "%41%25"}, {"\xc3\xa9\xff", "%C3%A9%FF"}};
  for (const auto& row : rows) {
    EXPECT_EQ(percentEncode(row.plain, keeps), row.encoded);
    EXPECT_EQ(percentDecode(row.encoded), row.plain);
  }
  // Lower-case digits count; a "%" that begins no escape stays.
  const std::pair<std::string_view, std::string_view> decoded[] = {
      {"%c3%A9", "\xc3\xa9"}, {"%", "%"},     {"%4", "%4"},     {"%4g", "%4g"},
      {"%g4", "%g4"},         {"%%41", "%A"}, {"%2541", "%41"},
  };
  for (const auto& [given, expected] : decoded) EXPECT_EQ(percentDecode(given), expected) << given;
}

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

struct Refusal {
  int code = 0;
};

TEST(Result, HoldsAValueOrTheReasonWhyThereIsNone) {
  const Result<std::string> value = std::string("content");
  EXPECT_TRUE(value.ok());
  EXPECT_EQ(*value, "content");
  EXPECT_EQ(value->size(), 7U);
  const Result<std::string> failed = Failure{"no content"};
  EXPECT_FALSE(failed);
  EXPECT_EQ(failed.error(), "no content");
  const Result<int, Refusal> refused = Refusal{7};
  ASSERT_FALSE(refused);
  EXPECT_EQ(refused.error().code, 7);
  Result<std::unique_ptr<int>> owned = std::make_unique<int>(5);
  EXPECT_EQ(*std::move(*owned), 5);
}

TEST(Result, OfVoidHoldsSuccessOrTheReasonForTheFailure) {
  const Result<void> done;
  EXPECT_TRUE(done);
  const Result<void> failed = Failure{"why"};
  EXPECT_FALSE(failed.ok());
  EXPECT_EQ(failed.error(), "why");
  const Result<void> failedWithoutText = Failure{};
  EXPECT_FALSE(failedWithoutText) << "an empty text is a failure all the same";
  const Result<void, Refusal> refused = Refusal{7};
  ASSERT_FALSE(refused);
  EXPECT_EQ(refused.error().code, 7);
}

}  // namespace
}  // namespace orvanta::platform
