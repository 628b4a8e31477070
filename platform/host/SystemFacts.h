#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace orvanta::platform {

// Reads what the system's own files say of the device: pure functions from a file's content to a fact, nullopt when
// it says nothing.

// The value of one assignment in an os-release file, its quotes and escapes removed.
std::optional<std::string> osReleaseValue(std::string_view content, std::string_view key);

// The country in a locale's name, two capital letters: "de_DE.UTF-8" gives "DE", "C.UTF-8" and "es_419" nullopt.
std::optional<std::string> countryOfLocale(std::string_view locale);
// The country of the first of these variables that is set and not empty, as the C library chooses a locale: LC_ALL,
// LC_ADDRESS, LC_MONETARY, LANG.
std::optional<std::string> countryOfEnvironment();

// A text from DMI or the device tree up to its first terminator, trimmed; nullopt for the fillers that firmware
// leaves there.
std::optional<std::string> firmwareText(std::string_view content);

// 40 hexadecimal digits that tell devices apart and, without the machine's identifier, applications too.
std::optional<std::string> deriveDeviceIdentifier(std::string_view machineId, std::string_view application);

}  // namespace orvanta::platform
