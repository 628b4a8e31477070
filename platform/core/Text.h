#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "platform/core/Value.h"

namespace orvanta::platform {

// Small readings and forms of text that several folders need. Pure; any thread.

// ASCII letters only; in any locale.
bool equalsIgnoringCase(std::string_view a, std::string_view b);

// Two digits a byte, lower case.
std::string hexText(std::span<const std::uint8_t> bytes);
std::string hexText(std::string_view bytes);

// The system's text for an errno value, such as "No such file or directory".
std::string errnoText(int error);

// Each byte that `keeps` refuses becomes "%" and two upper-case hexadecimal digits.
std::string percentEncode(std::string_view text, bool (*keeps)(char));
// "%41" becomes "A"; a "%" that does not begin an escape stays as it is.
std::string percentDecode(std::string_view text);

// The one of `known` (at least one) that takes the fewest changes to become `word`: what was probably meant.
std::string_view nearestWord(std::string_view word, std::span<const std::string_view> known);

// The keys of `dictionary` that are not among `known`, as `unknown key "acess", did you mean "access"?`; empty when all
// are known.
std::string describeUnknownKeys(const Dictionary& dictionary, std::span<const std::string_view> known);

}  // namespace orvanta::platform
