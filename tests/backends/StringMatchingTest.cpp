#include "backends/StringMatching.h"

#include <gtest/gtest.h>

#include <tuple>

namespace orvanta {
namespace {

TEST(StringMatching, EqualsIgnoringCase) {
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
    EXPECT_EQ(equalsIgnoringCase(a, b), equal) << a << " and " << b;
    EXPECT_EQ(foldCase(a) == foldCase(b), equal) << a << " and " << b;
  }
}

TEST(StringMatching, Lists) {
  const struct {
    TextList list;
    std::optional<std::string> whole;
    bool whitelist, exact, fragment;
  } rows[] = {
      {{}, "DE", true, true, true},
      {{}, std::nullopt, true, true, true},
      {{}, std::nullopt, false, false, false},
      {{"a", "b"}, std::nullopt, true, false, false},
      {{"a", "b"}, std::nullopt, false, true, true},
      {{"a", "b"}, "B", true, true, true},
      {{"a", "b"}, "c", true, false, false},
      {{"ab"}, "xABy", true, false, true},
      {{"abc"}, "ab", true, false, false},
      {{""}, "Mail", true, false, true},
      {{""}, "", true, true, true},
      {{""}, std::nullopt, true, false, false},
  };
  for (const auto& row : rows) {
    const std::string what = (row.list.empty() ? "[]" : row.list.front()) + " / " + row.whole.value_or("(none)");
    EXPECT_EQ(matchExactStringWithList(row.list, row.whole, row.whitelist), row.exact) << what;
    EXPECT_EQ(matchStringWithList(row.list, row.whole, row.whitelist), row.fragment) << what;
  }
}

TEST(StringMatching, SplitsWithoutTrimming) {
  EXPECT_EQ(splitAtCommas("Mail, News,"), (TextList{"Mail", " News", ""}));
  EXPECT_EQ(splitAtCommas(""), (TextList{""}));
}

}  // namespace
}  // namespace orvanta
