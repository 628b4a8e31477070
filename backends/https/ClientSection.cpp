#include "backends/https/ClientSection.h"

#include <algorithm>

namespace orvanta {
namespace {

bool readsAsNumber(const Value& value) {
  return value.isNumber() || value.string() != nullptr;
}

// The checks give the problem with a value, or null.

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
    const Value* countries = valueUnder(*entry, StorebagKey::thresholdCountry);
    if (countries != nullptr && checkTextsOrNumbers(*countries) != nullptr) {
      return "has a \"country\" that is no list of country codes";
    }
    const Value* threshold = valueUnder(*entry, StorebagKey::threshold);
    if (threshold != nullptr && !readsAsNumber(*threshold)) return "has a \"threshold\" that is no number";
  }
  return nullptr;
}

// The problem with the value of a restricting key; null for the filters, which say where their problem is.
const char* check(const Value& value, StorebagType type) {
  switch (type) {
    case StorebagType::texts:
    case StorebagType::categories:
      return checkTextsOrNumbers(value);
    case StorebagType::textOrNumber:
      return checkNumber(value);
    case StorebagType::countryThresholds:
      return checkCountryThresholds(value);
    default:
      return nullptr;
  }
}

// The pieces of a comma-separated text; empty when the key is absent. False when it is not a text.
bool readPieces(const Dictionary& section, StorebagKey key, TextList& pieces) {
  const Value* value = valueUnder(section, key);
  if (value == nullptr) return true;
  if (value->string() == nullptr) return false;
  pieces = splitAtCommas(*value->string());
  return true;
}

}  // namespace

const Array* clientSections(const Dictionary& profile) {
  return profile.array(nameOf(StorebagKey::httpsClients));
}

bool matchClientNameAndServiceID(const Dictionary& section, const std::optional<std::string>& clientName,
                                 const std::optional<std::string>& serviceID) {
  TextList clients;
  TextList services;
  return readPieces(section, StorebagKey::client, clients) && readPieces(section, StorebagKey::service, services) &&
         matchExactStringWithList(clients, clientName, true) && matchStringWithList(services, serviceID, true);
}

bool isFrameworkEnabledForClient(const Dictionary& section, const OrvantaBackend::SelfVersion& ownVersion) {
  const Value* since = valueUnder(section, StorebagKey::enabledSince);
  if (since == nullptr) return true;
  return readsAsNumber(*since) && ownVersion >= OrvantaBackend::SelfVersion::parse(since->description());
}

std::optional<MalformedKey> findMalformedKey(const Dictionary& section) {
  for (const StorebagKeyInfo& row : storebagKeys()) {
    if (row.place != StorebagPlace::clientSection || row.wrongType != WrongType::reportsNothing) continue;
    const Value* value = section.find(row.name);
    if (value == nullptr) continue;
    if (const char* problem = check(*value, row.type)) return MalformedKey{std::string(row.name), problem};
  }
  return std::nullopt;
}

const Value* valueUnder(const Dictionary& dictionary, StorebagKey key) {
  return dictionary.find(nameOf(key));
}

const std::string* textUnder(const Dictionary& dictionary, StorebagKey key) {
  return dictionary.text(nameOf(key));
}

std::optional<double> realUnder(const Dictionary& dictionary, StorebagKey key) {
  const Value* value = valueUnder(dictionary, key);
  if (value == nullptr || !readsAsNumber(*value)) return std::nullopt;
  return value->doubleValue();
}

std::optional<std::int32_t> intUnder(const Dictionary& dictionary, StorebagKey key) {
  const Value* value = valueUnder(dictionary, key);
  if (value == nullptr || !readsAsNumber(*value)) return std::nullopt;
  return static_cast<std::int32_t>(value->integerValue());
}

TextList textsUnder(const Dictionary& dictionary, StorebagKey key) {
  TextList texts;
  const Array* list = dictionary.array(nameOf(key));
  if (list == nullptr) return texts;
  for (const Value& element : *list) texts.push_back(element.description());
  return texts;
}

}  // namespace orvanta
