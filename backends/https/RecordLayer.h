#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "backends/https/ReservedKeys.h"
#include "interface/Values.h"

namespace orvanta {

// A dictionary that is laid over many events, such as a session's user info: written as JSON once instead of once per
// event, and quick to ask whether it holds a key. Immutable, shared.
class RecordLayer {
 public:
  // Null for a null or empty dictionary.
  static std::shared_ptr<const RecordLayer> of(SharedDictionary entries);

  const Dictionary& entries() const { return *_entries; }
  bool holds(std::string_view key) const { return (_keyBits & bitOf(key)) != 0 && _entries->contains(key); }
  ReservedKeys reservedKeys() const { return _reservedKeys; }
  // Compact, a comma behind each field, without what can never be sent.
  const std::string& json() const { return _json; }
  void logUnsendable() const;

 private:
  explicit RecordLayer(SharedDictionary entries);
  static std::uint64_t bitOf(std::string_view key) {
    const auto last = key.empty() ? 0U : static_cast<unsigned char>(key.back());
    return std::uint64_t{1} << ((key.size() * 11U + last) % 64U);
  }

  const SharedDictionary _entries;
  std::uint64_t _keyBits = 0;
  ReservedKeys _reservedKeys = 0;
  std::string _json;
  std::vector<const Dictionary::Entry*> _unsendable;
};

}  // namespace orvanta
