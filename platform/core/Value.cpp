#include "platform/core/Value.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>
#include <system_error>

#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {

bool isSpace(char c) {
  return c == ' ' || (c >= '\t' && c <= '\r');
}
bool isDigit(char c) {
  return c >= '0' && c <= '9';
}

// The text after leading white space and at most one sign.
struct SignedText {
  bool negative = false;
  std::string_view rest;
};

SignedText splitSign(std::string_view text) {
  while (!text.empty() && isSpace(text.front())) text.remove_prefix(1);
  if (text.empty() || (text.front() != '-' && text.front() != '+')) return {false, text};
  return {text.front() == '-', text.substr(1)};
}

std::int64_t leadingInteger(std::string_view text) {
  constexpr auto kMaximum = static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
  const SignedText split = splitSign(text);
  const std::uint64_t limit = split.negative ? kMaximum + 1 : kMaximum;
  std::uint64_t magnitude = 0;
  for (const char c : split.rest) {
    if (!isDigit(c)) break;
    const auto digit = static_cast<std::uint64_t>(c - '0');
    if (magnitude > (limit - digit) / 10) {
      magnitude = limit;
      break;
    }
    magnitude = magnitude * 10 + digit;
  }
  return static_cast<std::int64_t>(split.negative ? 0 - magnitude : magnitude);
}

double leadingDouble(std::string_view text) {
  const SignedText split = splitSign(text);
  const std::string_view rest = split.rest;
  // from_chars would also take "inf", "nan" and a second sign.
  const std::size_t first = !rest.empty() && rest.front() == '.' ? 1 : 0;
  if (first >= rest.size() || !isDigit(rest[first])) return 0;
  double magnitude = 0;
  const auto [end, error] = std::from_chars(rest.data(), rest.data() + rest.size(), magnitude);
  if (error == std::errc::result_out_of_range) {
    const std::string_view number(rest.data(), static_cast<std::size_t>(end - rest.data()));
    const bool tiny = number.front() == '.' || number.find("e-") != number.npos || number.find("E-") != number.npos ||
                      number.starts_with("0.");
    magnitude = tiny ? 0 : std::numeric_limits<double>::infinity();
  }
  return split.negative ? -magnitude : magnitude;
}

std::int64_t truncate(double v) {
  if (std::isnan(v)) return 0;
  if (v >= 0x1p63) return std::numeric_limits<std::int64_t>::max();
  if (v <= -0x1p63) return std::numeric_limits<std::int64_t>::min();
  return static_cast<std::int64_t>(v);
}

bool textIsTrue(std::string_view text) {
  if (equalsIgnoringCase(text, "yes") || equalsIgnoringCase(text, "true")) return true;
  return leadingDouble(text) != 0;
}

Value::Storage unsignedStorage(std::uint64_t v) {
  if (v <= static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) return static_cast<std::int64_t>(v);
  return v;
}

bool keyLess(const Dictionary::Entry& entry, std::string_view key) {
  return entry.first < key;
}
bool byKey(const Dictionary::Entry& a, const Dictionary::Entry& b) {
  return a.first < b.first;
}

}  // namespace

Dictionary::Dictionary() = default;
Dictionary::Dictionary(const Dictionary&) = default;
Dictionary::Dictionary(Dictionary&&) noexcept = default;
Dictionary& Dictionary::operator=(const Dictionary&) = default;
Dictionary& Dictionary::operator=(Dictionary&&) noexcept = default;
Dictionary::~Dictionary() = default;

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
  _entries.reserve(entries.size());
  for (const Entry& entry : entries) set(entry.first, entry.second);
}

std::optional<Dictionary> Dictionary::fromUniqueEntries(std::vector<Entry>&& entries) {
  // Writers send sorted keys, so that as a rule one pass over them is all.
  const auto notAscending = [](const Entry& a, const Entry& b) { return a.first >= b.first; };
  Dictionary result;
  if (std::adjacent_find(entries.begin(), entries.end(), notAscending) == entries.end()) {
    result._entries = std::move(entries);
    return result;
  }
  // Sorted by reference first: the entries must stay in place until it is known that no key occurs twice.
  std::vector<Entry*> order;
  order.reserve(entries.size());
  for (Entry& entry : entries) order.push_back(&entry);
  std::sort(order.begin(), order.end(), [](const Entry* a, const Entry* b) { return a->first < b->first; });
  const auto sameKey = [](const Entry* a, const Entry* b) { return a->first == b->first; };
  if (std::adjacent_find(order.begin(), order.end(), sameKey) != order.end()) return std::nullopt;
  result._entries.reserve(entries.size());
  for (Entry* entry : order) result._entries.push_back(std::move(*entry));
  entries.clear();
  return result;
}

const Value* Dictionary::find(std::string_view key) const {
  const auto found = std::lower_bound(_entries.begin(), _entries.end(), key, keyLess);
  return found != _entries.end() && found->first == key ? &found->second : nullptr;
}

Value* Dictionary::find(std::string_view key) {
  return const_cast<Value*>(std::as_const(*this).find(key));
}

const std::string* Dictionary::text(std::string_view key) const {
  const Value* value = find(key);
  return value == nullptr ? nullptr : value->string();
}

const Array* Dictionary::array(std::string_view key) const {
  const Value* value = find(key);
  return value == nullptr ? nullptr : value->array();
}

const Dictionary* Dictionary::dictionary(std::string_view key) const {
  const Value* value = find(key);
  return value == nullptr ? nullptr : value->dictionary();
}

void Dictionary::set(std::string_view key, Value value) {
  const auto place = std::lower_bound(_entries.begin(), _entries.end(), key, keyLess);
  if (place != _entries.end() && place->first == key) {
    place->second = std::move(value);
  } else {
    _entries.emplace(place, std::string(key), std::move(value));
  }
}

bool Dictionary::erase(std::string_view key) {
  const auto found = std::lower_bound(_entries.begin(), _entries.end(), key, keyLess);
  if (found == _entries.end() || found->first != key) return false;
  _entries.erase(found);
  return true;
}

void Dictionary::merge(const Dictionary& other) {
  std::vector<Entry> merged;
  merged.reserve(_entries.size() + other._entries.size());
  auto mine = _entries.begin();
  for (const Entry& theirs : other._entries) {
    while (mine != _entries.end() && byKey(*mine, theirs)) merged.push_back(std::move(*mine++));
    if (mine != _entries.end() && mine->first == theirs.first) ++mine;
    merged.push_back(theirs);
  }
  std::move(mine, _entries.end(), std::back_inserter(merged));
  _entries = std::move(merged);
}

std::size_t Dictionary::size() const {
  return _entries.size();
}
Dictionary::const_iterator Dictionary::begin() const {
  return _entries.begin();
}
Dictionary::const_iterator Dictionary::end() const {
  return _entries.end();
}
Dictionary::iterator Dictionary::begin() {
  return _entries.begin();
}
Dictionary::iterator Dictionary::end() {
  return _entries.end();
}

bool operator==(const Dictionary& a, const Dictionary& b) {
  return a._entries == b._entries;
}

Value::Value(std::nullptr_t) {}
Value::Value(bool v) : _storage(v) {}
Value::Value(int v) : _storage(static_cast<std::int64_t>(v)) {}
Value::Value(unsigned v) : _storage(static_cast<std::int64_t>(v)) {}
Value::Value(long v) : _storage(static_cast<std::int64_t>(v)) {}
Value::Value(long long v) : _storage(static_cast<std::int64_t>(v)) {}
Value::Value(unsigned long v) : _storage(unsignedStorage(v)) {}
Value::Value(unsigned long long v) : _storage(unsignedStorage(v)) {}
Value::Value(double v) : _storage(v) {}
Value::Value(const char* v) : _storage(std::string(v)) {}
Value::Value(std::string v) : _storage(std::move(v)) {}
Value::Value(std::string_view v) : _storage(std::string(v)) {}
Value::Value(Data v) : _storage(std::move(v)) {}
Value::Value(Date v) : _storage(v) {}
Value::Value(Array v) : _storage(std::move(v)) {}
Value::Value(Dictionary v) : _storage(std::move(v)) {}
Value::Value(const Value&) = default;
Value::Value(Value&&) noexcept = default;
Value& Value::operator=(const Value&) = default;
Value& Value::operator=(Value&&) noexcept = default;
Value::~Value() = default;

std::int64_t Value::integerValue() const {
  if (const auto* v = std::get_if<std::int64_t>(&_storage)) return *v;
  if (const auto* v = std::get_if<std::uint64_t>(&_storage)) return static_cast<std::int64_t>(*v);
  if (const auto* v = std::get_if<bool>(&_storage)) return *v ? 1 : 0;
  if (const auto* v = std::get_if<double>(&_storage)) return truncate(*v);
  if (const std::string* v = string()) return leadingInteger(*v);
  return 0;
}

double Value::doubleValue() const {
  if (const auto* v = std::get_if<double>(&_storage)) return *v;
  if (const auto* v = std::get_if<std::int64_t>(&_storage)) return static_cast<double>(*v);
  if (const auto* v = std::get_if<std::uint64_t>(&_storage)) return static_cast<double>(*v);
  if (const auto* v = std::get_if<bool>(&_storage)) return *v ? 1 : 0;
  if (const std::string* v = string()) return leadingDouble(*v);
  return 0;
}

bool Value::boolValue() const {
  return booleanReading().value_or(false);
}

std::optional<bool> Value::booleanReading() const {
  if (const auto* v = std::get_if<bool>(&_storage)) return *v;
  if (isInteger()) return integerValue() != 0;
  // A value that is not a number is not a consent either.
  if (const auto* v = std::get_if<double>(&_storage)) return *v != 0 && !std::isnan(*v);
  if (const std::string* v = string()) return textIsTrue(*v);
  return std::nullopt;
}

bool operator==(const Value& a, const Value& b) {
  return a._storage == b._storage;
}

}  // namespace orvanta::platform
