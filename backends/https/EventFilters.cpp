#include "backends/https/EventFilters.h"

#include <fmt/format.h>

#include <algorithm>
#include <optional>

#include "backends/OrvantaBackend.h"
#include "backends/https/EventField.h"
#include "backends/https/ReservedKeys.h"
#include "backends/https/StringMatching.h"

namespace orvanta {
namespace {

bool isAscii(std::string_view text) {
  return std::all_of(text.begin(), text.end(), [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

// A number, or a text, which reads as its leading number. False for other types.
bool readNumber(const Dictionary& definition, std::string_view key, std::int32_t& number) {
  const Value* value = definition.find(key);
  if (value == nullptr) return true;
  if (!value->isNumber() && value->string() == nullptr) return false;
  number = static_cast<std::int32_t>(value->integerValue());
  return true;
}

std::int32_t numberIn(const Dictionary& event, ReservedKey key) {
  const Value* value = event.find(nameOf(key));
  return value == nullptr ? 0 : static_cast<std::int32_t>(value->integerValue());
}

}  // namespace

Result<EventFilters> EventFilters::createFiltersFromArray(const Array& definitions) {
  EventFilters made;
  made._filters.reserve(definitions.size());
  for (std::size_t i = 0; i < definitions.size(); ++i) {
    const auto refuse = [&](std::string_view why) { return Failure{fmt::format("filter {} {}", i, why)}; };
    const Dictionary* definition = definitions[i].dictionary();
    if (definition == nullptr) return refuse("is no dictionary");
    filterTag tag;
    if (!readNumber(*definition, "method", tag.method)) return refuse("has a \"method\" that is no number");
    if (!readNumber(*definition, "status", tag.status)) return refuse("has a \"status\" that is no number");
    if (const Value* key = definition->find("key")) {
      if (key->string() == nullptr) return refuse("has a \"key\" that is no text");
      tag.key = *key->string();
    }
    if (const Value* action = definition->find("action"); action != nullptr && action->string() != nullptr) {
      if (*action->string() == "remove") tag.action = filterTag::kRemove;
      if (*action->string() == "sha256") tag.action = filterTag::kSHA256;
    }
    if (tag.key) {
      // Letters beyond ASCII may change their length with their case.
      made._keyBits |= isAscii(*tag.key) ? bitOf(*tag.key) : ~std::uint64_t{0};
      made._namesReservedKey |= std::any_of(kReservedKeyNames.begin(), kReservedKeyNames.end(),
                                            [&](std::string_view name) { return equalsIgnoringCase(name, *tag.key); });
    }
    made._filters.push_back(std::move(tag));
  }
  return made;
}

const filterTag* EventFilters::search(std::string_view key, std::int32_t method, std::int32_t status) const {
  for (const filterTag& tag : _filters) {
    if (tag.method >= 0 && tag.method != method) continue;
    if (tag.status >= 0 && tag.status != status) continue;
    if (tag.key && equalsIgnoringCase(*tag.key, key)) return &tag;
  }
  return nullptr;
}

void EventFilters::filterEvent(Dictionary& event) const {
  if (empty()) return;
  const std::int32_t method = numberIn(event, ReservedKey::method);
  const std::int32_t status = numberIn(event, ReservedKey::status);
  std::vector<Dictionary::Entry> kept;
  kept.reserve(event.size());
  for (auto& [key, value] : event) {
    const filterTag* tag = find(key, method, status);
    const std::int32_t action = tag == nullptr ? filterTag::kNone : tag->action;
    if (action == filterTag::kNone) {
      kept.emplace_back(key, std::move(value));
    } else if (auto digest = action == filterTag::kSHA256 ? digestOf(value) : std::nullopt) {
      kept.emplace_back(key, std::move(*digest));
    }
  }
  event = std::move(*Dictionary::fromUniqueEntries(std::move(kept)));
}

std::optional<std::string> digestOf(const Value& value) {
  const auto text = textForDigest(value);
  if (!text) return std::nullopt;
  return OrvantaBackend::convertIntoSHA256(*text);
}

}  // namespace orvanta
