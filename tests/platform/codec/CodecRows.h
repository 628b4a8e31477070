#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <ostream>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "platform/core/Value.h"

namespace orvanta::platform {
// How test failures show values.
inline void PrintTo(const Value& value, std::ostream* out) {
  *out << value.description();
}
}  // namespace orvanta::platform

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

// Makes values of every type but null and of every size class, the same ones in every run.
class RandomValues {
 public:
  explicit RandomValues(std::uint32_t seed) : _random(seed) {}
  platform::Value next(int depth = 0) {
    switch (below(depth < 4 ? 9 : 7)) {
      case 0:
        return below(2) == 1;
      case 1:
        return static_cast<std::int64_t>(bits());
      case 2:
        return bits();
      case 3:
        return (static_cast<double>(bits()) - 0x1p63) / static_cast<double>(1 + below(1000));
      case 4:
        return text();
      case 5: {
        platform::Data data;
        data.bytes.resize(size());
        for (auto& byte : data.bytes) byte = static_cast<std::uint8_t>(below(256));
        return data;
      }
      case 6:
        return platform::Date{static_cast<double>(below(4'000'000'000U)) - 1e9};
      case 7: {
        platform::Array array;
        for (std::size_t i = below(20); i > 0; --i) array.push_back(next(depth + 1));
        return array;
      }
      default: {
        platform::Dictionary dictionary;
        for (std::size_t i = below(20); i > 0; --i) dictionary.set(text(), next(depth + 1));
        return dictionary;
      }
    }
  }

 private:
  std::uint64_t below(std::uint64_t limit) { return _random() % limit; }
  // Numbers of every width.
  std::uint64_t bits() { return _random() >> below(64); }
  std::size_t size() { return below(100) == 0 ? 60'000 + below(10'000) : below(300); }
  std::string text() {
    static constexpr const char* kPieces[] = {"a",  "Z",  "9",  " ",  "<",   "&", ">", "\"",
                                              "\\", "\n", "\r", "\t", "]]>", "é", "€", "𝄞"};
    std::string text;
    for (std::size_t i = below(40); i > 0; --i) text += kPieces[below(std::size(kPieces))];
    return text;
  }

  std::mt19937_64 _random;
};

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
