#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace orvanta::platform {

// Small readings and forms of text that several folders need. Pure; any thread.

// ASCII letters only; in any locale.
bool equalsIgnoringCase(std::string_view a, std::string_view b);

// Two digits a byte, lower case.
std::string hexText(std::span<const std::uint8_t> bytes);
std::string hexText(std::string_view bytes);

// What the system says of an errno value, such as "No such file or directory".
std::string errnoText(int error);

// Each byte that `keeps` refuses becomes "%" and two upper-case hexadecimal digits.
std::string percentEncode(std::string_view text, bool (*keeps)(char));
// "%41" becomes "A"; a "%" that does not begin an escape stays as it is.
std::string percentDecode(std::string_view text);

}  // namespace orvanta::platform
