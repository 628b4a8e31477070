#include "platform/core/Value.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <optional>

namespace orvanta::platform {
namespace {

constexpr std::int64_t kMaximum = std::numeric_limits<std::int64_t>::max();
constexpr std::int64_t kMinimum = std::numeric_limits<std::int64_t>::min();
constexpr double kInfinity = std::numeric_limits<double>::infinity();

TEST(Value, Readings) {
  const struct {
    std::vector<Value> given;
    std::int64_t integer;
    double real;
    std::optional<bool> boolean;
  } rows[] = {
      {{Value(), Data{{1}}, Date{5}, Array{1}, Dictionary{{"a", 1}}}, 0, 0, std::nullopt},
      {{true}, 1, 1, true},
      {{std::uint64_t{18446744073709551615U}}, -1, 18446744073709551615.0, true},
      {{2.9}, 2, 2.9, true},
      {{1e300}, kMaximum, 1e300, true},
      {{-kInfinity}, kMinimum, -kInfinity, true},
      {{"12", " \t+12ab"}, 12, 12, true},
      {{"-3.75e1x"}, -3, -37.5, true},
      {{"9223372036854775808"}, kMaximum, 9223372036854775808.0, true},
      {{"1e999"}, 1, kInfinity, true},
      {{"1e-999"}, 1, 0, false},
      {{"YES", "tRuE"}, 0, 0, true},
      {{false, "inf", "--1", "", "0", "yesterday", "no"}, 0, 0, false},
  };
  for (const auto& row : rows) {
    for (const Value& given : row.given) {
      SCOPED_TRACE(given.description());
      EXPECT_EQ(given.integerValue(), row.integer);
      EXPECT_EQ(given.doubleValue(), row.real);
      EXPECT_EQ(given.booleanReading(), row.boolean);
      EXPECT_EQ(given.boolValue(), row.boolean.value_or(false));
    }
  }
  EXPECT_EQ(Value(std::nan("")).integerValue(), 0);
  EXPECT_FALSE(Value(std::nan("")).boolValue());
}

TEST(Value, Descriptions) {
  const std::pair<Value, const char*> rows[] = {
      {Value(), "null"},
      {std::uint64_t{18446744073709551615U}, "18446744073709551615"},
      {"text as it is\n", "text as it is\n"},
      {Date{-1.5}, "1969-12-31 23:59:58 +0000"},
      {Date{1e300}, "1e+300 s since 1970"},
      {Data{{0, 0xab}}, "<00ab>"},
      {Array{}, "{}"},
      {Dictionary{{"b", Array{1, "x"}}, {"a", 2}}, "{a = 2, b = {1, x}}"},
  };
  for (const auto& [given, expected] : rows) EXPECT_EQ(given.description(), expected);

  // Those of containers and data are bounded.
  Value deep = 1;
  for (int i = 0; i < 1000; ++i) deep = Array{std::move(deep)};
  const Value large[] = {
      Data{std::vector<std::uint8_t>(1'000'000)},
      Array(100'000, Value("element")),
      Array{std::string(1'000'000, 'x'), 1},
      Dictionary{{std::string(1'000'000, 'k'), 1}},
      deep,
  };
  for (const Value& row : large) {
    EXPECT_LT(row.description().size(), 5000U);
    EXPECT_NE(row.description().find("…"), std::string::npos);
  }
}

TEST(Dictionary, TypedLookUpsGiveOnlyValuesOfTheirType) {
  const Dictionary dictionary{{"text", "t"},      {"array", Array{1, 2}}, {"dictionary", Dictionary{{"inner", 1}}},
                              {"number", 1},      {"null", Value()},      {"data", Data{{'t'}}},
                              {"boolean", false}, {"date", Date{1}}};
  for (const auto& [key, value] : dictionary) {
    SCOPED_TRACE(key);
    EXPECT_EQ(dictionary.text(key), key == "text" ? value.string() : nullptr);
    EXPECT_EQ(dictionary.array(key), key == "array" ? value.array() : nullptr);
    EXPECT_EQ(dictionary.dictionary(key), key == "dictionary" ? value.dictionary() : nullptr);
  }
  EXPECT_EQ(*dictionary.text("text"), "t");
  EXPECT_EQ(dictionary.array("array")->size(), 2U);
  EXPECT_TRUE(dictionary.dictionary("dictionary")->contains("inner"));
  EXPECT_EQ(dictionary.text("absent"), nullptr);
  EXPECT_EQ(dictionary.array("absent"), nullptr);
  EXPECT_EQ(dictionary.dictionary("absent"), nullptr);
}

}  // namespace
}  // namespace orvanta::platform
