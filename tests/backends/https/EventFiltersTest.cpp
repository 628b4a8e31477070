#include "backends/https/EventFilters.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <tuple>

#include "backends/OrvantaBackend.h"
#include "backends/https/StringMatching.h"

namespace orvanta {
namespace {

std::string sha(std::string_view text) {
  return OrvantaBackend::convertIntoSHA256(text);
}

Dictionary rule(const char* key, const char* action, Dictionary more = {}) {
  more.merge({{"key", key}, {"action", action}});
  return more;
}

TEST(EventFilters, FilterEvent) {
  const Dictionary removeA = rule("a", "remove");
  const Dictionary nested{{"b", Dictionary{{"a", "x"}}}};
  const Array inCategory3{rule("a", "sha256", {{"method", 3}}), removeA};
  const struct {
    const char* what;
    Array definitions;
    Dictionary event, expected;
  } rows[] = {
      {"no rules", {}, {{"a", 1}}, {{"a", 1}}},
      {"any category, any case",
       {rule("User", "remove")},
       {{"USER", 1}, {"user", 2}, {"_method", 9}},
       {{"_method", 9}}},
      {"beyond ASCII", {rule("größe", "remove")}, {{"GRÖßE", 1}, {"grosse", 2}}, {{"grosse", 2}}},
      {"first match: hashed", inCategory3, {{"_method", 3}, {"a", "Anna's"}}, {{"_method", 3}, {"a", sha("Anna's")}}},
      {"first match: removed", inCategory3, {{"_method", 4}, {"a", "Anna's"}}, {{"_method", 4}}},
      {"an unknown action shields from later rules", {rule("a", "Remove"), removeA}, {{"a", 1}}, {{"a", 1}}},
      {"no key never matches", {Dictionary{{"action", "remove"}}}, {{"", 1}, {"a", 1}}, {{"", 1}, {"a", 1}}},
      {"another status",
       {rule("a", "remove", {{"status", 2}})},
       {{"a", 1}, {"_status", 3}},
       {{"a", 1}, {"_status", 3}}},
      {"the status", {rule("a", "remove", {{"status", 2}})}, {{"a", 1}, {"_status", 2}}, {{"_status", 2}}},
      {"absent numbers are 0", {rule("a", "remove", {{"method", 0}, {"status", 0}})}, {{"a", 1}}, {}},
      {"a negative is any", {rule("a", "remove", {{"method", -7}})}, {{"a", 1}, {"_method", 5}}, {{"_method", 5}}},
      {"a rule may take what the rules look at",
       {rule("_METHOD", "remove", {{"method", 5}}), rule("a", "remove", {{"method", 5}})},
       {{"a", 1}, {"_method", 5}},
       {}},
      {"nested fields are no fields", {removeA}, nested, nested},
  };
  for (const auto& row : rows) {
    const auto filters = EventFilters::createFiltersFromArray(row.definitions);
    ASSERT_TRUE(filters.ok()) << row.what;
    Dictionary event = row.event;
    filters->filterEvent(event);
    EXPECT_EQ(Value(event), Value(row.expected)) << row.what << ": " << Value(event).description();
  }
}

// A digest must neither let the value through nor make sendable what is never sent.
TEST(EventFilters, DigestsOfEveryType) {
  const std::pair<Value, Value> rows[] = {
      {"abc", "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"},
      {0.5, sha("0.5")},
      {true, sha("1")},
      {std::numeric_limits<std::uint64_t>::max(), sha("18446744073709551615")},
      {platform::Date{1.5}, sha("1.5")},
      {std::nan(""), nullptr},
      {std::numeric_limits<double>::infinity(), nullptr},
      {nullptr, nullptr},
      {platform::Data{{1, 2}}, nullptr},
      {Array{"secret"}, nullptr},
      {Dictionary{{"secret", 1}}, nullptr},
  };
  const auto filters = EventFilters::createFiltersFromArray({rule("k", "sha256")});
  ASSERT_TRUE(filters.ok());
  for (const auto& [value, expected] : rows) {
    Dictionary event{{"k", value}, {"other", 1}};
    filters->filterEvent(event);
    Dictionary wanted{{"other", 1}};
    if (!expected.isNull()) wanted.set("k", expected);
    EXPECT_EQ(Value(event), Value(wanted)) << value.description();
  }
}

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
