#include "backends/https/EventFilters.h"

#include <fmt/format.h>

#include <algorithm>
#include <optional>

#include "backends/OrvantaBackend.h"
#include "backends/https/EventField.h"
#include "backends/https/ReservedKeys.h"
#include "backends/https/StringMatching.h"
#include "config/StorebagKeys.h"

namespace orvanta {
namespace {

bool isAscii(std::string_view text) {
  return std::all_of(text.begin(), text.end(), [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

// A number, or a text, which reads as its leading number. False for other types.
bool readNumber(const Dictionary& definition, StorebagKey key, std::int32_t& number) {
  const Value* value = definition.find(nameOf(key));
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
    FilterRule rule;
    if (!readNumber(*definition, StorebagKey::filterMethod, rule.method))
      return refuse("has a \"method\" that is no number");
    if (!readNumber(*definition, StorebagKey::filterStatus, rule.status))
      return refuse("has a \"status\" that is no number");
    if (const Value* key = definition->find(nameOf(StorebagKey::filterKey))) {
      if (key->string() == nullptr) return refuse("has a \"key\" that is no text");
      rule.key = *key->string();
    }
    if (const std::string* action = definition->text(nameOf(StorebagKey::filterAction))) {
      if (*action == "remove") rule.action = FilterRule::Action::remove;
      if (*action == "sha256") rule.action = FilterRule::Action::sha256;
    }
    if (rule.key) {
      // Letters beyond ASCII may change their length with their case.
      made._keyBits |= isAscii(*rule.key) ? bitOf(*rule.key) : ~std::uint64_t{0};
      made._namesReservedKey |= std::any_of(kReservedKeyNames.begin(), kReservedKeyNames.end(),
                                            [&](std::string_view name) { return equalsFolded(name, *rule.key); });
    }
    made._filters.push_back(std::move(rule));
  }
  return made;
}

const FilterRule* EventFilters::search(std::string_view key, std::int32_t method, std::int32_t status) const {
  for (const FilterRule& rule : _filters) {
    if (rule.method >= 0 && rule.method != method) continue;
    if (rule.status >= 0 && rule.status != status) continue;
    if (rule.key && equalsFolded(*rule.key, key)) return &rule;
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
    const FilterRule* rule = find(key, method, status);
    const FilterRule::Action action = rule == nullptr ? FilterRule::Action::none : rule->action;
    if (action == FilterRule::Action::none) {
      kept.emplace_back(key, std::move(value));
    } else if (auto digest = action == FilterRule::Action::sha256 ? digestOf(value) : std::nullopt) {
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
