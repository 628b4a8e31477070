#pragma once

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

#include "tests/platform/RandomValue.h"

namespace orvanta::test {

// Values, each with the inputs that are read as it.
template <class Given>
using ReadRows = std::vector<std::pair<platform::Value, std::vector<Given>>>;
// Parts of reasons, each with the inputs that are refused for it.
template <class Given>
using RefusedRows = std::vector<std::pair<const char*, std::vector<Given>>>;

template <class Given, class Parse>
void expectValues(Parse parse, const ReadRows<Given>& rows) {
  for (const auto& [expected, inputs] : rows) {
    for (const Given& given : inputs) {
      const auto parsed = parse(given);
      ASSERT_TRUE(parsed.ok()) << testing::PrintToString(given) << ": " << parsed.error();
      EXPECT_EQ(*parsed, expected) << testing::PrintToString(given);
    }
  }
}

template <class Given, class Parse>
void expectRefusals(Parse parse, const RefusedRows<Given>& rows) {
  for (const auto& [reason, inputs] : rows) {
    for (const Given& given : inputs) {
      const auto parsed = parse(given);
      ASSERT_FALSE(parsed.ok()) << testing::PrintToString(given);
      EXPECT_NE(parsed.error().find(reason), std::string::npos) << testing::PrintToString(given) << parsed.error();
    }
  }
}

// Random values are the same when they have been written and read.
template <class Write, class Parse>
void expectRoundTrips(std::uint32_t seed, Write write, Parse parse) {
  RandomValues values(seed);
  for (int i = 0; i < 300; ++i) {
    const platform::Value value = values.next();
    const auto written = write(value);
    ASSERT_TRUE(written.ok()) << written.error();
    const auto parsed = parse(*written);
    ASSERT_TRUE(parsed.ok()) << parsed.error();
    EXPECT_EQ(*parsed, value);
  }
}

}  // namespace orvanta::test
