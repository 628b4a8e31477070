#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "interface/Values.h"

namespace orvanta {

// One rule: what happens to the field of that name in events of that category and type.
struct FilterRule {
  enum class Action { none, remove, sha256 };
  std::int32_t method = -1;  // category; negative: any
  std::int32_t status = -1;  // type; negative: any
  Action action = Action::none;
  std::optional<std::string> key;  // compared without case; a rule without one never matches
};

// The table of fields that must not leave the device as they are: built once per evaluation, scanned for every field of
// every event. Owned by its backend and used on the session's queue; immutable. Fields that no rule names cost no
// allocation.
class EventFilters {
 public:
  EventFilters() = default;
  // Fails, with the reason, when an element is invalid: a table that lost a rule would let a field through.
  static Result<EventFilters> createFiltersFromArray(const Array& definitions);

  bool empty() const { return _filters.empty(); }
  // Returns whether a rule may name one of the reserved keys.
  bool namesReservedKey() const { return _namesReservedKey; }

  // The first rule, in table order, for that field of an event of that category and type; null when no rule fits.
  const FilterRule* find(std::string_view key, std::int32_t method, std::int32_t status) const {
    return (_keyBits & bitOf(key)) == 0 ? nullptr : search(key, method, status);
  }

  // Removes or hashes the matching fields of a flat dictionary in place; its "_method" and "_status" (0 when absent)
  // are the category and type.
  void filterEvent(Dictionary& event) const;

 private:
  // One bit by length and first letter, so that most names are passed over at once.
  static std::uint64_t bitOf(std::string_view key) {
    const auto first = key.empty() ? 0U : static_cast<unsigned char>(key.front()) | 0x20U;
    return std::uint64_t{1} << ((key.size() * 7U + first) % 64U);
  }
  const FilterRule* search(std::string_view key, std::int32_t method, std::int32_t status) const;

  std::vector<FilterRule> _filters;
  std::uint64_t _keyBits = 0;
  bool _namesReservedKey = false;
};

// The digest of a value: 64 hexadecimal digits over its text. Nullopt when the value can never be sent, so that the
// field is to be removed.
std::optional<std::string> digestOf(const Value& value);

}  // namespace orvanta
