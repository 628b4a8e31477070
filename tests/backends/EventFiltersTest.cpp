#include "backends/EventFilters.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "backends/OrvantaBackend.h"

namespace orvanta {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

std::string sha(std::string_view text) {
  return OrvantaBackend::convertIntoSHA256(text);
}

Value rule(Dictionary definition) {
  return definition;
}

struct FilterRow {
  const char* what;
  Array definitions;
  Dictionary event;
  Dictionary expected;
};

TEST(EventFilters, FilterEvent) {
  const Value removeUser = rule({{"key", "userName"}, {"action", "remove"}});
  const FilterRow rows[] = {
      {"any category, without case", {removeUser}, {{"USERNAME", "x"}, {"_method", 9}}, {{"_method", 9}}},
      {"both cases of the name", {removeUser}, {{"USERNAME", "x"}, {"username", 1}, {"user", 2}}, {{"user", 2}}},
      {"first match wins: hash in category 3",
       {rule({{"method", 3}, {"key", "deviceName"}, {"action", "sha256"}}),
        rule({{"key", "deviceName"}, {"action", "remove"}})},
       {{"_method", 3}, {"deviceName", "Anna's"}},
       {{"_method", 3}, {"deviceName", sha("Anna's")}}},
      {"first match wins: removed elsewhere",
       {rule({{"method", 3}, {"key", "deviceName"}, {"action", "sha256"}}),
        rule({{"key", "deviceName"}, {"action", "remove"}})},
       {{"_method", 4}, {"deviceName", "Anna's"}},
       {{"_method", 4}}},
      {"an unknown action shields from later rules",
       {rule({{"key", "a"}, {"action", "Remove"}}), removeUser, rule({{"key", "a"}, {"action", "remove"}})},
       {{"a", 1}},
       {{"a", 1}}},
      {"an absent action shields too",
       {rule({{"key", "a"}}), rule({{"key", "a"}, {"action", "remove"}})},
       {{"a", 1}},
       {{"a", 1}}},
      {"no key never matches", {rule({{"action", "remove"}})}, {{"", 1}, {"a", 1}}, {{"", 1}, {"a", 1}}},
      {"an empty key is a key", {rule({{"key", ""}, {"action", "remove"}})}, {{"", 1}, {"a", 1}}, {{"a", 1}}},
      {"the status counts",
       {rule({{"key", "a"}, {"status", 2}, {"action", "remove"}})},
       {{"a", 1}, {"_status", 3}},
       {{"a", 1}, {"_status", 3}}},
      {"the status fits",
       {rule({{"key", "a"}, {"status", 2}, {"action", "remove"}})},
       {{"a", 1}, {"_status", 2}},
       {{"_status", 2}}},
      {"absent numbers are 0",
       {rule({{"key", "a"}, {"method", 0}, {"status", 0}, {"action", "remove"}})},
       {{"a", 1}},
       {}},
      {"any negative number is any",
       {rule({{"key", "a"}, {"method", -7}, {"action", "remove"}})},
       {{"a", 1}, {"_method", 5}},
       {{"_method", 5}}},
      {"numbers as text",
       {rule({{"key", "a"}, {"method", "5"}, {"action", "remove"}})},
       {{"a", 1}, {"_method", "5"}},
       {{"_method", "5"}}},
      {"a rule may take what the rules look at",
       {rule({{"key", "_METHOD"}, {"method", 5}, {"action", "remove"}}),
        rule({{"key", "a"}, {"method", 5}, {"action", "remove"}})},
       {{"a", 1}, {"_method", 5}},
       {}},
      {"beyond ASCII",
       {rule({{"key", "größe"}, {"action", "remove"}})},
       {{"GRÖßE", 1}, {"grosse", 2}},
       {{"grosse", 2}}},
      {"nested fields are no fields",
       {removeUser},
       {{"a", Dictionary{{"userName", "x"}}}},
       {{"a", Dictionary{{"userName", "x"}}}}},
      {"no rules", {}, {{"a", 1}}, {{"a", 1}}},
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
  const double infinite = std::numeric_limits<double>::infinity();
  const std::pair<Value, Value> rows[] = {
      {"text", sha("text")},
      {"", sha("")},
      {"na\xC3\xAFve", sha("na\xC3\xAFve")},
      {12, sha("12")},
      {-7, sha("-7")},
      {0.5, sha("0.5")},
      {true, sha("1")},
      {false, sha("0")},
      {std::numeric_limits<std::uint64_t>::max(), sha("18446744073709551615")},
      {platform::Date{1.5}, sha("1.5")},
      {std::nan(""), nullptr},
      {infinite, nullptr},
      {nullptr, nullptr},
      {platform::Data{{1, 2}}, nullptr},
      {Array{"secret"}, nullptr},
      {Dictionary{{"secret", 1}}, nullptr},
  };
  const auto filters = EventFilters::createFiltersFromArray({rule({{"key", "k"}, {"action", "sha256"}})});
  ASSERT_TRUE(filters.ok());
  for (const auto& [value, expected] : rows) {
    Dictionary event{{"k", value}, {"other", 1}};
    filters->filterEvent(event);
    Dictionary wanted{{"other", 1}};
    if (!expected.isNull()) wanted.set("k", expected);
    EXPECT_EQ(Value(event), Value(wanted)) << value.description();
  }
}

TEST(EventFilters, RefusesWhatMakesNoSense) {
  const Array rows[] = {
      {"text"},
      {rule({{"key", 5}})},
      {rule({{"key", "a"}, {"method", Array{}}})},
      {rule({{"key", "a"}, {"status", Dictionary{}}})},
      {rule({{"key", "a"}}), nullptr},
  };
  for (const auto& definitions : rows) {
    const auto filters = EventFilters::createFiltersFromArray(definitions);
    EXPECT_FALSE(filters.ok()) << Value(definitions).description();
    EXPECT_NE(filters.ok() ? std::string::npos : filters.error().find("filter"), std::string::npos);
  }
}

TEST(EventFilters, KnowsWhetherReservedKeysAreNamed) {
  const auto names = [](const char* key) {
    return EventFilters::createFiltersFromArray({rule({{"key", key}, {"action", "remove"}})})->namesReservedKey();
  };
  EXPECT_TRUE(names("_SESSIONID"));
  EXPECT_TRUE(names("EventTime"));
  EXPECT_FALSE(names("sessionID"));
}

}  // namespace
}  // namespace orvanta
