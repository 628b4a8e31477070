#pragma once

#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace orvanta::platform {

class Value;

// Raw bytes, as opposed to text.
struct Data {
  std::vector<std::uint8_t> bytes;
  friend bool operator==(const Data&, const Data&) = default;
};

// A point in time, in seconds since 1970-01-01 UTC.
struct Date {
  double secondsSince1970 = 0;
  friend bool operator==(const Date&, const Date&) = default;
};

using Array = std::vector<Value>;

// A string-keyed map kept as one flat vector sorted by key: small, cache-friendly, with a stable order of enumeration.
// Iterators and pointers to values stay valid until the dictionary changes.
class Dictionary {
 public:
  using Entry = std::pair<std::string, Value>;
  using const_iterator = std::vector<Entry>::const_iterator;
  using iterator = std::vector<Entry>::iterator;

  Dictionary();
  Dictionary(std::initializer_list<Entry> entries);  // on equal keys the later entry wins
  // Takes entries in any order. Returns nullopt, and takes nothing, when a key occurs twice.
  static std::optional<Dictionary> fromUniqueEntries(std::vector<Entry>&& entries);
  Dictionary(const Dictionary&);
  Dictionary(Dictionary&&) noexcept;
  Dictionary& operator=(const Dictionary&);
  Dictionary& operator=(Dictionary&&) noexcept;
  ~Dictionary();

  const Value* find(std::string_view key) const;  // null when absent
  Value* find(std::string_view key);
  bool contains(std::string_view key) const { return find(key) != nullptr; }
  // Null when the value is absent or of another type.
  const std::string* text(std::string_view key) const;
  const Array* array(std::string_view key) const;
  const Dictionary* dictionary(std::string_view key) const;
  void set(std::string_view key, Value value);  // replaces an earlier value
  bool erase(std::string_view key);             // returns whether the key was there
  void merge(const Dictionary& other);          // other's values win on equal keys

  std::size_t size() const;
  bool empty() const { return size() == 0; }
  const_iterator begin() const;
  const_iterator end() const;
  iterator begin();
  iterator end();

  friend bool operator==(const Dictionary&, const Dictionary&);

 private:
  std::vector<Entry> _entries;
};

// A property-list value. Plain value semantics: copies are deep, moves are cheap, no thread owns it.
// Integers up to 2^63-1 are held as int64; only larger ones as uint64, so that equal numbers compare equal.
class Value {
 public:
  using Storage = std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, std::string, Data, Date,
                               Array, Dictionary>;

  Value();
  Value(std::nullptr_t);  // NOLINTBEGIN(google-explicit-constructor): literals read as values in dictionaries
  Value(bool v);
  Value(int v);
  Value(unsigned v);
  Value(long v);
  Value(long long v);
  Value(unsigned long v);
  Value(unsigned long long v);
  Value(double v);
  Value(const char* v);
  Value(std::string v);
  Value(std::string_view v);
  Value(Data v);
  Value(Date v);
  Value(Array v);
  Value(Dictionary v);  // NOLINTEND(google-explicit-constructor)
  Value(const Value&);
  Value(Value&&) noexcept;
  Value& operator=(const Value&);
  Value& operator=(Value&&) noexcept;
  ~Value();

  bool isNull() const { return std::holds_alternative<std::monostate>(_storage); }
  bool isBool() const { return std::holds_alternative<bool>(_storage); }
  bool isInteger() const {
    return std::holds_alternative<std::int64_t>(_storage) || std::holds_alternative<std::uint64_t>(_storage);
  }
  bool isNumber() const { return isBool() || isInteger() || std::holds_alternative<double>(_storage); }

  // Null when another alternative is held.
  const std::string* string() const { return std::get_if<std::string>(&_storage); }
  const Array* array() const { return std::get_if<Array>(&_storage); }
  const Dictionary* dictionary() const { return std::get_if<Dictionary>(&_storage); }
  const Data* data() const { return std::get_if<Data>(&_storage); }
  const Date* date() const { return std::get_if<Date>(&_storage); }
  Array* array() { return std::get_if<Array>(&_storage); }
  Dictionary* dictionary() { return std::get_if<Dictionary>(&_storage); }
  std::string* string() { return std::get_if<std::string>(&_storage); }

  // Readings that never fail. A number reads as itself (doubles truncate toward zero and saturate; NaN is 0), a text as
  // its leading decimal number after white space ("12ab" is 12), everything else as 0. Unsigned numbers above 2^63-1
  // wrap, so that a cast to a narrower type takes the low bits.
  std::int64_t integerValue() const;
  double doubleValue() const;
  // True for true, non-zero numbers, "YES", "true" (any case) and texts that begin with a non-zero number.
  bool boolValue() const;
  // The same, but nullopt for types that have no boolean reading (null, data, date, array, dictionary).
  std::optional<bool> booleanReading() const;
  // A readable form for logs and texts: numbers in decimal (booleans as 1 and 0, doubles as the shortest text that
  // reads back the same), strings as they are, dates as "YYYY-MM-DD hh:mm:ss +0000", data as <hex>, containers in
  // braces on one line. Bounded: long data and containers are cut with an ellipsis.
  std::string description() const;

  const Storage& storage() const { return _storage; }
  Storage& storage() { return _storage; }

  friend bool operator==(const Value& a, const Value& b);

 private:
  Storage _storage;
};

inline Value::Value() = default;  // here, since decoders make many empty values

// A payload or record that several owners read and no one changes; null where it is absent.
using SharedDictionary = std::shared_ptr<const Dictionary>;
using SharedArray = std::shared_ptr<const Array>;

// "YYYY-MM-DD hh:mm:ss +0000" in UTC.
std::string describeDate(double secondsSince1970);

}  // namespace orvanta::platform
