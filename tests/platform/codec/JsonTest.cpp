#include "platform/codec/Json.h"

#include <cmath>
#include <limits>

#include "tests/platform/codec/CodecRows.h"

namespace orvanta::platform {
namespace {

using namespace orvanta::test;

TEST(Json, WritesCompactly) {
  const std::pair<Value, const char*> rows[] = {
      {Value(), "null"},
      {std::numeric_limits<std::int64_t>::min(), "-9223372036854775808"},
      {std::uint64_t{18446744073709551615U}, "18446744073709551615"},
      {0.1, "0.1"},
      {-0.0, "-0.0"},
      {std::nan(""), "null"},
      {std::numeric_limits<double>::infinity(), "null"},
      {Date{1.5}, "1.5"},
      {Data{{0xff, 0}}, "\"/wA=\""},
      {Dictionary{{"b", Array{1, nullptr}}, {"a", "x"}}, R"({"a":"x","b":[1,null]})"},
  };
  for (const auto& [given, expected] : rows) EXPECT_EQ(writeJson(given), expected);
  std::string out;
  EXPECT_FALSE(appendJsonNumber(out, -std::numeric_limits<double>::infinity()));
  EXPECT_EQ(out, "");
  EXPECT_EQ(writeJson(Dictionary{{"a", Array{1, Dictionary{}}}, {"b", 2}}, true),
            "{\n  \"a\": [\n    1,\n    {}\n  ],\n  \"b\": 2\n}");
}

TEST(Json, EscapesTextWhereverItStands) {
  const std::pair<std::string_view, std::string_view> rows[] = {
      {"/\x7f\"\\", "/\x7f\\\"\\\\"},
      {"\b\f\n\r\t", "\\b\\f\\n\\r\\t"},
      {std::string_view("\0\x1f", 2), "\\u0000\\u001f"},
      {"é€𝄞", "é€𝄞"},
      {"\xff", "\xef\xbf\xbd"},
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

TEST(Json, Parses) {
  const ReadRows<std::string> rows = {
      {true, {" true "}},
      {std::numeric_limits<std::int64_t>::min(), {"-9223372036854775808"}},
      {std::uint64_t{18446744073709551615U}, {"18446744073709551615"}},
      {18446744073709551616.0, {"18446744073709551616"}},
      {100.0, {"1e2", "1E+2", "100.0"}},
      {0.0, {"1e-999", "-0.0e-10", "0.00000000000000000000000000000000000000000e5"}},
      {"é𝄞\n", {R"("\u00e9\ud834\udd1e\n")"}},
      {Dictionary{{"a", ""}, {"b", Array{-1, Dictionary{}}}}, {R"({"b":[-1,{}],"a":""})"}},
  };
  expectValues(parseJson, rows);
}

TEST(Json, RefusesWithThePlace) {
  const RefusedRows<std::string> rows = {
      {"byte 0", {"", "NaN"}},
      {"byte 1", {"01", "{1:2}"}},
      {"byte 3", {"[1,]", "[1 2]", "[1]\xef\xbb\xbf"}},
      {"byte 4", {"{\"a\"}"}},
      {"byte", {"tru", "\"a", "[1e999]", "-", "1.", ".5", "1e", "+1", "\"\xff\"", R"("\ud834")", "\"\x01\""}},
      {"too big", {"1" + std::string(400, '0')}},
      {"same key twice", {R"({"a":1,"a":2})"}},
      {"zero byte", {std::string("1\0", 2)}},
      {"Nesting deeper than 64", {std::string(65, '[') + std::string(65, ']'), std::string(10'000'000, '[')}},
  };
  expectRefusals(parseJson, rows);
  EXPECT_TRUE(parseJson(std::string(64, '[') + std::string(64, ']')).ok());
}

}  // namespace
}  // namespace orvanta::platform
