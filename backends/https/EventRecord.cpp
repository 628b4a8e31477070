#include "backends/https/EventRecord.h"

#include <algorithm>

#include "backends/https/EventField.h"

namespace orvanta {
namespace {

constexpr ReservedKey kOwnKeys[] = {ReservedKey::sessionID,     ReservedKey::eventNumber, ReservedKey::method,
                                    ReservedKey::status,        ReservedKey::clientTS,    ReservedKey::eventTime,
                                    ReservedKey::timezoneOffset};

const Dictionary& orEmpty(const SharedDictionary& dictionary) {
  static const Dictionary kEmpty;
  return dictionary ? *dictionary : kEmpty;
}

std::size_t footprintOf(const Dictionary& dictionary);

std::size_t footprintOf(const Value& value) {
  if (const auto* text = value.string()) return text->size();
  if (const auto* data = value.data()) return data->bytes.size();
  if (const auto* dictionary = value.dictionary()) return footprintOf(*dictionary);
  std::size_t total = 0;
  if (const auto* array = value.array()) {
    for (const auto& element : *array) total += sizeof(element) + footprintOf(element);
  }
  return total;
}

std::size_t footprintOf(const Dictionary& dictionary) {
  std::size_t total = 0;
  for (const auto& entry : dictionary) total += sizeof(entry) + entry.first.size() + footprintOf(entry.second);
  return total;
}

}  // namespace

EventRecord::EventRecord(std::shared_ptr<const SessionFields> fields, Event event,
                         std::optional<std::string> combinedSessionID, std::int32_t timezoneOffset)
    : _fields(std::move(fields)),
      _event(std::move(event)),
      _combinedSessionID(std::move(combinedSessionID)),
      _clientTS(_fields->clientTS(_event.time)),
      _timezoneOffset(timezoneOffset),
      _category(_event.category),
      _present(_fields->present) {
  for (const ReservedKey key : kOwnKeys) _present |= setOf(key);
  if (!_combinedSessionID && !_fields->numericSessionID) _present &= ~setOf(ReservedKey::sessionID);
}

void EventRecord::prepare(std::shared_ptr<const RecordLayer> userInfo, const EventFilters& filters) {
  _userInfo = std::move(userInfo);
  if (!filters.empty()) applyFilters(filters);
  const Change* change = changeOf(nameOf(ReservedKey::method));
  if (change == nullptr) {
    _category = visibleNumber(ReservedKey::method);
  } else {
    _category = change->digest ? static_cast<std::int32_t>(Value(*change->digest).integerValue()) : 0;
  }
}

// Before any filter.
std::int32_t EventRecord::visibleNumber(ReservedKey key) const {
  if (_userInfo && (_userInfo->reservedKeys() & setOf(key)) != 0) {
    return static_cast<std::int32_t>(_userInfo->entries().find(nameOf(key))->integerValue());
  }
  return key == ReservedKey::method ? _event.category : _event.type;
}

Value EventRecord::ownValue(ReservedKey key) const {
  switch (key) {
    case ReservedKey::sessionID:
      if (_fields->numericSessionID) return *_fields->numericSessionID;
      return _combinedSessionID ? Value(*_combinedSessionID) : Value();
    case ReservedKey::eventNumber:
      return static_cast<int>(_event.number);
    case ReservedKey::method:
      return static_cast<int>(_event.category);
    case ReservedKey::status:
      return static_cast<int>(_event.type);
    case ReservedKey::clientTS:
    case ReservedKey::eventTime:
      return _clientTS;
    case ReservedKey::timezoneOffset:
      return _timezoneOffset;
    default:
      return _fields->value(key);
  }
}

void EventRecord::applyFilters(const EventFilters& filters) {
  const std::int32_t method = visibleNumber(ReservedKey::method);
  const std::int32_t status = visibleNumber(ReservedKey::status);
  const auto apply = [&](std::string_view key, const FilterRule* rule, const Value& value) {
    if (rule->action == FilterRule::Action::remove) _changes.push_back({key, std::nullopt});
    if (rule->action == FilterRule::Action::sha256) _changes.push_back({key, digestOf(value)});
  };
  ReservedKeys hidden = 0;
  if (_userInfo) {
    hidden = _userInfo->reservedKeys();
    for (const auto& [key, value] : _userInfo->entries()) {
      if (const auto* rule = filters.find(key, method, status)) apply(key, rule, value);
    }
  }
  if (filters.namesReservedKey()) {
    for (std::size_t i = 0; i < kReservedKeyCount; ++i) {
      const auto key = static_cast<ReservedKey>(i);
      if ((_present & ~hidden & setOf(key)) == 0) continue;
      if (const auto* rule = filters.find(nameOf(key), method, status)) apply(nameOf(key), rule, ownValue(key));
    }
  }
  _filteredAbovePayload = !_changes.empty();
  hidden |= _present;
  for (const auto& [key, value] : orEmpty(_event.payload)) {
    const auto* rule = filters.find(key, method, status);
    if (rule == nullptr || (reservedKeyNamed(key) & hidden) != 0) continue;
    if (!_userInfo || !_userInfo->holds(key)) apply(key, rule, value);
  }
  std::sort(_changes.begin(), _changes.end(), [](const Change& a, const Change& b) { return a.key < b.key; });
}

const EventRecord::Change* EventRecord::changeOf(std::string_view key) const {
  if (_changes.empty()) return nullptr;
  const auto found = std::lower_bound(_changes.begin(), _changes.end(), key,
                                      [](const Change& change, std::string_view k) { return change.key < k; });
  return found != _changes.end() && found->key == key ? &*found : nullptr;
}

std::size_t EventRecord::footprint() const {
  constexpr std::size_t kReservedFieldsAbout = 512;
  return kReservedFieldsAbout + footprintOf(orEmpty(_event.payload));
}

void EventRecord::write(FieldWriter& writer, const Overlay& overlay) const {
  const RecordLayer* const info = overlay.userInfo != nullptr ? overlay.userInfo : _userInfo.get();
  const bool oneInfo = !_userInfo || info == _userInfo.get();
  if (oneInfo && !_filteredAbovePayload && (info == nullptr || info->reservedKeys() == 0)) {
    writeLayers(writer, overlay, info);
  } else {
    for (const auto& [key, value] : flatten(overlay)) writer.value(key, value);
  }
}

void EventRecord::writeLayers(FieldWriter& writer, const Overlay& overlay, const RecordLayer* info) const {
  const auto writeInfo = [&] {
    if (writer.form() == FieldWriter::Form::compact) {
      writer.fragment(info->json());
      info->logUnsendable();
    } else {
      for (const auto& [key, value] : info->entries()) writer.value(key, value);
    }
  };
  const auto inInfo = [&](std::string_view key) { return info != nullptr && info->holds(key); };

  if (overlay.userInfo != nullptr) writeInfo();
  if (overlay.relabelled && overlay.sessionID != nullptr) writer.text(ReservedKey::sessionID, *overlay.sessionID);
  const ReservedKeys relabelled = overlay.relabelled ? setOf(ReservedKey::sessionID) : 0;
  for (const Change& change : _changes) {
    if (!change.digest || (reservedKeyNamed(change.key) & relabelled) != 0 || inInfo(change.key)) continue;
    writer.text(change.key, *change.digest);
  }
  if (overlay.userInfo == nullptr && info != nullptr) writeInfo();
  writeReserved(writer, !overlay.relabelled);
  const ReservedKeys hidden = _present | relabelled;
  for (const auto& [key, value] : orEmpty(_event.payload)) {
    if ((reservedKeyNamed(key) & hidden) == 0 && !inInfo(key) && changeOf(key) == nullptr) writer.value(key, value);
  }
}

void EventRecord::writeReserved(FieldWriter& writer, bool withSessionID) const {
  if (writer.form() == FieldWriter::Form::compact) {
    writer.fragment(_fields->json);
  } else {
    for (std::size_t i = 0; i <= static_cast<std::size_t>(ReservedKey::reportVers); ++i) {
      const auto key = static_cast<ReservedKey>(i);
      if ((_fields->present & setOf(key)) != 0) writer.value(nameOf(key), _fields->value(key));
    }
  }
  if (withSessionID && _fields->numericSessionID) {
    writer.number(ReservedKey::sessionID, std::int64_t{*_fields->numericSessionID});
  } else if (withSessionID && _combinedSessionID) {
    writer.text(ReservedKey::sessionID, *_combinedSessionID);
  }
  writer.number(ReservedKey::eventNumber, _event.number);
  writer.number(ReservedKey::method, _event.category);
  writer.number(ReservedKey::status, _event.type);
  writer.number({ReservedKey::clientTS, ReservedKey::eventTime}, _clientTS);
  writer.number(ReservedKey::timezoneOffset, _timezoneOffset);
}

Dictionary EventRecord::flatten(const Overlay& overlay) const {
  Dictionary flat = orEmpty(_event.payload);
  for (std::size_t i = 0; i < kReservedKeyCount; ++i) {
    const auto key = static_cast<ReservedKey>(i);
    if ((_present & setOf(key)) != 0) flat.set(nameOf(key), ownValue(key));
  }
  if (_userInfo) flat.merge(_userInfo->entries());
  for (const Change& change : _changes) {
    if (change.digest) {
      flat.set(change.key, *change.digest);
    } else {
      flat.erase(change.key);
    }
  }
  if (overlay.relabelled) {
    flat.erase(nameOf(ReservedKey::sessionID));
    if (overlay.sessionID != nullptr) flat.set(nameOf(ReservedKey::sessionID), *overlay.sessionID);
  }
  if (overlay.userInfo != nullptr) flat.merge(overlay.userInfo->entries());
  return flat;
}

}  // namespace orvanta
