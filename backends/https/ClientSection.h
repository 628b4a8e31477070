#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "backends/OrvantaBackend.h"
#include "backends/https/StringMatching.h"
#include "config/StorebagKeys.h"
#include "interface/Values.h"

namespace orvanta {

// Reading a storebag's HTTPS profiles: for whom each client section is, and keys in the types that config/StorebagKeys
// gives them. Pure.

// The profile's client sections; null when it has no such list.
const Array* clientSections(const Dictionary& profile);
// Returns whether the section is for that client and service. One whose "client" or "service" is not a text never is.
bool matchClientNameAndServiceID(const Dictionary& section, const std::optional<std::string>& clientName,
                                 const std::optional<std::string>& serviceID);
// Returns whether the daemon's version reaches the section's "enabledSince", which never happens when that is neither a
// text nor a number.
bool isFrameworkEnabledForClient(const Dictionary& section, const OrvantaBackend::SelfVersion& ownVersion);

// A key that restricts who or what reports (WrongType::reportsNothing), and what is wrong with its value. Such a
// section must not be used: without the restriction it would let more out than its author meant.
struct MalformedKey {
  std::string key;
  std::string problem;  // follows the key in a sentence
};
// Returns nullopt when every restriction can be read.
std::optional<MalformedKey> findMalformedKey(const Dictionary& section);

// The value of any type under the key; null when absent.
const Value* valueUnder(const Dictionary& dictionary, StorebagKey key);
// The text under the key; null when absent or not a text.
const std::string* textUnder(const Dictionary& dictionary, StorebagKey key);
// A number or a text that reads as one; nullopt when absent or of another type.
std::optional<double> realUnder(const Dictionary& dictionary, StorebagKey key);
std::optional<std::int32_t> intUnder(const Dictionary& dictionary, StorebagKey key);
// The list of texts under the key, numbers as their decimal text; empty when absent or not a list.
TextList textsUnder(const Dictionary& dictionary, StorebagKey key);

}  // namespace orvanta
