#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "backends/OrvantaBackend.h"
#include "backends/https/StringMatching.h"
#include "interface/Values.h"

namespace orvanta {

// Reading a storebag's client sections: for whom each is, and its keys in the types that they should have. Pure.

// The profile's client sections; null when there is no such list.
const Array* clientSections(const Dictionary& profile);
// Whether the section is for that client and service. A "client" or "service" that is no text is for nobody.
bool matchClientNameAndServiceID(const Dictionary& section, const std::optional<std::string>& clientName,
                                 const std::optional<std::string>& serviceID);
// Whether the daemon's version reaches the section's "enabledSince"; one that is neither text nor number is never
// reached.
bool isFrameworkEnabledForClient(const Dictionary& section, const OrvantaBackend::SelfVersion& ownVersion);

// A key that restricts who or what reports, and what is wrong with its value. Such a section must not be used: without
// the restriction it would let more out than its author meant.
struct MalformedKey {
  std::string key;
  std::string problem;  // follows the key in a sentence
};
std::optional<MalformedKey> findMalformedKey(const Dictionary& section);

// The text under the key; null when absent or no text.
const std::string* textUnder(const Dictionary& dictionary, std::string_view key);
// A number or a text that reads as one; none when absent or something else.
std::optional<double> realUnder(const Dictionary& dictionary, std::string_view key);
std::optional<std::int32_t> intUnder(const Dictionary& dictionary, std::string_view key);
// The list of texts under the key, numbers as their decimal text; empty when absent or no list.
TextList textsUnder(const Dictionary& dictionary, std::string_view key);

}  // namespace orvanta
