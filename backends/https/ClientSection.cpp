#include "backends/https/ClientSection.h"

#include <algorithm>

#include "backends/https/EventFilters.h"

namespace orvanta {
namespace {

bool readsAsNumber(const Value& value) {
  return value.isNumber() || value.string() != nullptr;
}

// The problem with a value, or null.
using Check = const char* (*)(const Value&);

const char* checkTextsOrNumbers(const Value& value) {
  const Array* list = value.array();
  if (list == nullptr) return "is no list";
  return std::all_of(list->begin(), list->end(), readsAsNumber) ? nullptr
                                                                : "holds something that is neither text nor number";
}

const char* checkNumber(const Value& value) {
  return readsAsNumber(value) ? nullptr : "is no number";
}

const char* checkCountryThresholds(const Value& value) {
  const Array* list = value.array();
  if (list == nullptr) return "is no list";
  for (const Value& element : *list) {
    const Dictionary* entry = element.dictionary();
    if (entry == nullptr) return "holds something that is no dictionary";
    const Value* countries = entry->find("country");
    if (countries != nullptr && checkTextsOrNumbers(*countries) != nullptr) {
      return "has a \"country\" that is no list of country codes";
    }
    const Value* threshold = entry->find("threshold");
    if (threshold != nullptr && !readsAsNumber(*threshold)) return "has a \"threshold\" that is no number";
  }
  return nullptr;
}

struct KeyCheck {
  const char* key;
  Check check;
};

constexpr KeyCheck kKeyChecks[] = {
    {"locale_whitelist", checkTextsOrNumbers},
    {"device_whitelist", checkTextsOrNumbers},
    {"device_blacklist", checkTextsOrNumbers},
    {"sampling_threshold", checkNumber},
    {"per_country_sampling_thresholds", checkCountryThresholds},
    {"override_sampling", checkNumber},
    {"event_whitelist", checkTextsOrNumbers},
    {"event_blacklist", checkTextsOrNumbers},
};

// The pieces of a comma-separated text; empty when the key is absent. False when it is no text.
bool readPieces(const Dictionary& section, std::string_view key, TextList& pieces) {
  const Value* value = section.find(key);
  if (value == nullptr) return true;
  if (value->string() == nullptr) return false;
  pieces = splitAtCommas(*value->string());
  return true;
}

}  // namespace

const Array* clientSections(const Dictionary& profile) {
  const Value* clients = profile.find("clients");
  return clients == nullptr ? nullptr : clients->array();
}

bool matchClientNameAndServiceID(const Dictionary& section, const std::optional<std::string>& clientName,
                                 const std::optional<std::string>& serviceID) {
  TextList clients;
  TextList services;
  return readPieces(section, "client", clients) && readPieces(section, "service", services) &&
         matchExactStringWithList(clients, clientName, true) && matchStringWithList(services, serviceID, true);
}

bool isFrameworkEnabledForClient(const Dictionary& section, const OrvantaBackend::SelfVersion& ownVersion) {
  const Value* since = section.find("enabledSince");
  if (since == nullptr) return true;
  return readsAsNumber(*since) && ownVersion >= OrvantaBackend::SelfVersion::parse(since->description());
}

std::optional<MalformedKey> findMalformedKey(const Dictionary& section) {
  for (const KeyCheck& row : kKeyChecks) {
    const Value* value = section.find(row.key);
    if (value == nullptr) continue;
    if (const char* problem = row.check(*value)) return MalformedKey{row.key, problem};
  }
  if (const Value* filters = section.find("filters")) {
    if (filters->array() == nullptr) return MalformedKey{"filters", "is no list"};
    const auto made = EventFilters::createFiltersFromArray(*filters->array());
    if (!made) return MalformedKey{"filters", "does not hold: " + made.error()};
  }
  return std::nullopt;
}

const std::string* textUnder(const Dictionary& dictionary, std::string_view key) {
  const Value* value = dictionary.find(key);
  return value == nullptr ? nullptr : value->string();
}

std::optional<double> realUnder(const Dictionary& dictionary, std::string_view key) {
  const Value* value = dictionary.find(key);
  if (value == nullptr || !readsAsNumber(*value)) return std::nullopt;
  return value->doubleValue();
}

std::optional<std::int32_t> intUnder(const Dictionary& dictionary, std::string_view key) {
  const Value* value = dictionary.find(key);
  if (value == nullptr || !readsAsNumber(*value)) return std::nullopt;
  return static_cast<std::int32_t>(value->integerValue());
}

TextList textsUnder(const Dictionary& dictionary, std::string_view key) {
  TextList texts;
  const Value* value = dictionary.find(key);
  if (value == nullptr || value->array() == nullptr) return texts;
  for (const Value& element : *value->array()) texts.push_back(element.description());
  return texts;
}

}  // namespace orvanta
