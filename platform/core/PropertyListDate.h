#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace orvanta::platform {

// "YYYY-MM-DDThh:mm:ssZ" as XML property lists have it, to and from seconds since 1970. Both return nullopt for what is
// not such a date or a time that the form cannot carry. Fractions of a second are cut off in writing.
std::optional<double> parsePropertyListDate(std::string_view text);
std::optional<std::string> formatPropertyListDate(double secondsSince1970);

}  // namespace orvanta::platform
