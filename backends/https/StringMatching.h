#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace orvanta {

// Comparisons without case, for names that storebags and clients write as they like. Letters of the Latin, Greek,
// Cyrillic and Armenian scripts are folded one by one; composed and decomposed accents stay different. Pure,
// thread-safe.

std::string foldCase(std::string_view text);
// Allocates nothing.
bool equalsFolded(std::string_view a, std::string_view b);

// Return whether the string is on the list: as a whole element, or with some element occurring in it (an empty element
// occurs in every string). `whitelist` decides only where the list cannot: an empty or absent list gives `whitelist`,
// an absent string its opposite.
using TextList = std::vector<std::string>;
bool matchExactStringWithList(const TextList& list, const std::optional<std::string>& wholeString, bool whitelist);
bool matchStringWithList(const TextList& list, const std::optional<std::string>& wholeString, bool whitelist);

// The pieces between commas, untrimmed; an empty text is one empty piece.
TextList splitAtCommas(std::string_view text);

}  // namespace orvanta
