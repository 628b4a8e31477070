#include "backends/https/RecordLayer.h"

#include "backends/https/EventField.h"
#include "platform/codec/Json.h"

namespace orvanta {

std::shared_ptr<const RecordLayer> RecordLayer::of(SharedDictionary entries) {
  if (!entries || entries->empty()) return nullptr;
  return std::shared_ptr<const RecordLayer>(new RecordLayer(std::move(entries)));
}

RecordLayer::RecordLayer(SharedDictionary entries) : _entries(std::move(entries)) {
  for (const auto& entry : *_entries) {
    const auto& [key, value] = entry;
    _keyBits |= bitOf(key);
    _reservedKeys |= reservedKeyNamed(key);
    const std::size_t before = _json.size();
    platform::appendJsonString(_json, key);
    _json.push_back(':');
    if (appendFieldValue(_json, value)) {
      _json.push_back(',');
    } else {
      _json.resize(before);
      _unsendable.push_back(&entry);
    }
  }
}

void RecordLayer::logUnsendable() const {
  for (const auto* entry : _unsendable) orvanta::logUnsendable(entry->first, entry->second);
}

}  // namespace orvanta
