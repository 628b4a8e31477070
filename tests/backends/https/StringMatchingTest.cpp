#include "backends/https/StringMatching.h"

#include <gtest/gtest.h>

#include <tuple>

namespace orvanta {
namespace {

TEST(StringMatching, EqualsFolded) {
  const std::tuple<const char*, const char*, bool> rows[] = {
      {"userName", "USERNAME", true},
      {"Größe", "GRÖSSE", false},  // letters are folded one by one
      {"GRÖẞE", "größe", false},
      {"ÄÖÜ", "äöü", true},
      {"ΑΘΉΝΑΣ", "αθήνας", true},  // a final sigma is a sigma
      {"ПРИВЕТ", "привет", true},
      {"ՀԱՅ", "հայ", true},
      {"×", "÷", false},  // no letters, in the middle of a run of letters
      {"a", "ab", false},
      {"\xC3", "\xC3", true},  // stray bytes stand for themselves
      {"\xC3", "\xC2", false},
      {"\xE2\x82", "\xE2\x82\xAC", false},
  };
  for (const auto& [a, b, equal] : rows) {
    EXPECT_EQ(equalsFolded(a, b), equal) << a << " and " << b;
    EXPECT_EQ(foldCase(a) == foldCase(b), equal) << a << " and " << b;
  }
}

}  // namespace
}  // namespace orvanta
