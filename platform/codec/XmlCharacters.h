#pragma once

#include <optional>
#include <string_view>

namespace orvanta::platform {

// Whether XML has a way to carry this character at all, be it as a reference.
bool isXmlCharacter(char32_t codePoint);
// Offset of the first thing in `text` that is no XML character or no UTF-8; none when all is well.
std::optional<std::size_t> findNonXmlCharacter(std::string_view text);

}  // namespace orvanta::platform
