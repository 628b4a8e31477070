#include "platform/host/SystemFacts.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "platform/core/Text.h"
#include "platform/host/Digest.h"

namespace orvanta::platform {

namespace {

constexpr std::string_view kBlank = " \t\r\n";

std::string_view trimmed(std::string_view text) {
  const std::size_t begin = text.find_first_not_of(kBlank);
  if (begin == std::string_view::npos) return {};
  return text.substr(begin, text.find_last_not_of(kBlank) - begin + 1);
}

bool isLetter(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}
char lower(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}
char upper(char c) {
  return c >= 'a' && c <= 'z' ? static_cast<char>(c - 'a' + 'A') : c;
}

// os-release follows the shell's quoting, without its expansions.
std::string unquoted(std::string_view text) {
  std::string result;
  char quote = 0;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (quote == 0 && (c == '"' || c == '\'')) {
      quote = c;
    } else if (c == quote) {
      quote = 0;
    } else if (c == '\\' && quote != '\'' && i + 1 < text.size()) {
      result += text[++i];
    } else {
      result += c;
    }
  }
  return result;
}

// Compared without case.
constexpr std::array<std::string_view, 13> kFillers{"to be filled by o.e.m.",
                                                    "not specified",
                                                    "not available",
                                                    "not applicable",
                                                    "system product name",
                                                    "system serial number",
                                                    "default string",
                                                    "unknown",
                                                    "none",
                                                    "n/a",
                                                    "o.e.m.",
                                                    "0",
                                                    "0123456789"};

}  // namespace

std::optional<std::string> osReleaseValue(std::string_view content, std::string_view key) {
  std::optional<std::string> value;
  while (!content.empty()) {
    const std::size_t end = content.find('\n');
    const std::string_view line = trimmed(content.substr(0, end));
    content.remove_prefix(end == std::string_view::npos ? content.size() : end + 1);
    if (line.size() > key.size() && line.substr(0, key.size()) == key && line[key.size()] == '=') {
      value = unquoted(line.substr(key.size() + 1));  // as in the shell, the last assignment counts
    }
  }
  if (value && value->empty()) value.reset();
  return value;
}

std::optional<std::string> countryOfLocale(std::string_view locale) {
  const std::size_t underscore = locale.find('_');
  if (underscore == std::string_view::npos) return std::nullopt;
  const std::string_view rest = locale.substr(underscore + 1);
  const std::string_view territory = rest.substr(0, rest.find_first_of(".@"));
  if (territory.size() != 2 || !isLetter(territory[0]) || !isLetter(territory[1])) return std::nullopt;
  return std::string{upper(territory[0]), upper(territory[1])};
}

std::optional<std::string> countryOfEnvironment() {
  for (const char* variable : {"LC_ALL", "LC_ADDRESS", "LC_MONETARY", "LANG"}) {
    const char* locale = std::getenv(variable);
    if (locale != nullptr && *locale != 0) return countryOfLocale(locale);
  }
  return std::nullopt;
}

std::optional<std::string> firmwareText(std::string_view content) {
  const std::string_view text = trimmed(content.substr(0, content.find('\0')));
  if (text.empty()) return std::nullopt;
  std::string compared(text);
  std::transform(compared.begin(), compared.end(), compared.begin(), lower);
  if (std::find(kFillers.begin(), kFillers.end(), compared) != kFillers.end()) return std::nullopt;
  return std::string(text);
}

std::optional<std::string> deriveDeviceIdentifier(std::string_view machineId, std::string_view application) {
  const std::string_view id = trimmed(machineId);
  const bool isIdentifier = id.size() == 32 && id.find_first_not_of("0123456789abcdefABCDEF") == std::string_view::npos;
  if (!isIdentifier || id.find_first_not_of('0') == std::string_view::npos) return std::nullopt;  // not set up yet
  std::vector<std::uint8_t> bytes(application.begin(), application.end());
  bytes.push_back(0);
  bytes.insert(bytes.end(), id.begin(), id.end());
  return hexText(sha256(bytes)).substr(0, 40);
}

}  // namespace orvanta::platform
