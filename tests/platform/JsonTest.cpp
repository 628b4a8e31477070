#include "platform/Json.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "tests/platform/RandomValue.h"

namespace platform {
namespace {

TEST(Json, WritesCompactly) {
  const std::pair<Value, const char*> rows[] = {
      {Value(), "null"},
      {true, "true"},
      {std::numeric_limits<std::int64_t>::min(), "-9223372036854775808"},
      {std::uint64_t{18446744073709551615U}, "18446744073709551615"},
      {0.1, "0.1"},
      {1e22, "1e+22"},
      {-0.0, "-0.0"},
      {std::nan(""), "null"},
      {std::numeric_limits<double>::infinity(), "null"},
      {Date{1.5}, "1.5"},
      {Data{{0xff, 0}}, "\"/wA=\""},
      {Array{}, "[]"},
      {Dictionary{}, "{}"},
      {Dictionary{{"b", Array{1, nullptr}}, {"a", "x"}}, R"({"a":"x","b":[1,null]})"},
  };
  for (const auto& [given, expected] : rows) EXPECT_EQ(writeJson(given), expected);
}

TEST(Json, WritesIndented) {
  EXPECT_EQ(writeJson(Dictionary{{"a", Array{1, Dictionary{}}}, {"b", 2}}, true),
            "{\n  \"a\": [\n    1,\n    {}\n  ],\n  \"b\": 2\n}");
}

TEST(Json, EscapesTextWhereverItStands) {
  const std::pair<std::string_view, std::string_view> rows[] = {
      {"", ""},
      {"/", "/"},
      {"\x7f", "\x7f"},
      {"\"", "\\\""},
      {"\\", "\\\\"},
      {"\b\f\n\r\t", "\\b\\f\\n\\r\\t"},
      {std::string_view("\0\x1f", 2), "\\u0000\\u001f"},
      {"é€𝄞", "é€𝄞"},
      {"\xff", "\xef\xbf\xbd"},
      {"\xe2\x82", "\xef\xbf\xbd"},
      {"\xc0\x80", "\xef\xbf\xbd\xef\xbf\xbd"},
  };
  for (const auto& [given, expected] : rows) {
    for (std::size_t before = 0; before < 10; ++before) {
      std::string out = "kept";
      appendJsonString(out, std::string(before, '!') + std::string(given) + "0123456789");
      EXPECT_EQ(out, "kept\"" + std::string(before, '!') + std::string(expected) + "0123456789\"");
    }
  }
}

TEST(Json, NumbersThatJsonLacksAppendNothing) {
  std::string out;
  EXPECT_FALSE(appendJsonNumber(out, std::nan("")));
  EXPECT_FALSE(appendJsonNumber(out, -std::numeric_limits<double>::infinity()));
  EXPECT_EQ(out, "");
}

TEST(Json, Parses) {
  const std::pair<std::string_view, Value> rows[] = {
      {"null", Value()},
      {" true ", true},
      {"-9223372036854775808", std::numeric_limits<std::int64_t>::min()},
      {"18446744073709551615", std::uint64_t{18446744073709551615U}},
      {"18446744073709551616", 18446744073709551616.0},
      {"1.0", 1.0},
      {"1e2", 100.0},
      {"0.1", 0.1},
      {"-0.0e-10", -0.0},
      {"1E+5", 100000.0},
      {"-12.5e-1", -1.25},
      {"1e-999", 0.0},
      {"0.00000000000000000000000000000000000000000e5", 0.0},
      {"-9223372036854775809", -9223372036854775808.0},
      {"[-1,0]", Array{-1, 0}},
      {R"("\u00e9\ud834\udd1e\n")", "é𝄞\n"},
      {R"({"b":[1,{}],"a":""})", Dictionary{{"a", ""}, {"b", Array{1, Dictionary{}}}}},
  };
  for (const auto& [given, expected] : rows) {
    const Result<Value> parsed = parseJson(given);
    ASSERT_TRUE(parsed.ok()) << given << ": " << parsed.error();
    EXPECT_EQ(*parsed, expected) << given;
  }
}

TEST(Json, RefusesWithThePlace) {
  const std::pair<std::string, const char*> rows[] = {
      {"", "byte 0"},
      {"[1,]", "byte 3"},
      {"[1 2]", "byte 3"},
      {"{\"a\"}", "byte 4"},
      {"tru", "byte"},
      {"1 2", "byte 2"},
      {"\"a", "byte"},
      {"NaN", "byte 0"},
      {"[1e999]", "byte"},
      {"1" + std::string(400, '0'), "too big"},
      {"-", "byte"},
      {"1.", "byte"},
      {".5", "byte"},
      {"1e", "byte"},
      {"+1", "byte"},
      {"\"\xff\"", "byte"},
      {R"("\ud834")", "byte"},
      {R"({"a":1,"a":2})", "same key twice"},
      {"\"\x01\"", "byte"},
      {"01", "byte 1"},
      {"{1:2}", "byte 1"},
      {std::string("1\0", 2), "zero byte"},
      {"[1]\xef\xbb\xbf", "byte 3"},
  };
  for (const auto& [given, expected] : rows) {
    const Result<Value> parsed = parseJson(given);
    ASSERT_FALSE(parsed.ok()) << given;
    EXPECT_NE(parsed.error().find(expected), std::string::npos) << given << ": " << parsed.error();
  }
}

TEST(Json, BoundsNesting) {
  EXPECT_TRUE(parseJson(std::string(64, '[') + std::string(64, ']')).ok());
  EXPECT_FALSE(parseJson(std::string(65, '[') + std::string(65, ']')).ok());
  EXPECT_FALSE(parseJson(std::string(10'000'000, '[')).ok());
}

// Data and dates come back as text and numbers, hence written twice.
TEST(Json, RoundTrip) {
  orvanta::test::RandomValues values(1);
  for (int i = 0; i < 300; ++i) {
    const std::string text = writeJson(values.next());
    const Result<Value> parsed = parseJson(text);
    ASSERT_TRUE(parsed.ok()) << parsed.error() << "\n" << text;
    EXPECT_EQ(writeJson(*parsed), text);
    const Result<Value> indented = parseJson(writeJson(*parsed, true));
    ASSERT_TRUE(indented.ok());
    EXPECT_EQ(*indented, *parsed);
  }
}

}  // namespace
}  // namespace platform
