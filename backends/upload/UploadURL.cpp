#include "backends/upload/UploadURL.h"

#include <fmt/format.h>

#include <algorithm>

#include "platform/core/Text.h"

namespace orvanta {

namespace {

constexpr std::string_view kDescription = "Parlix AFRC log";

bool isLetter(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}
bool isDigit(char c) {
  return c >= '0' && c <= '9';
}
bool isHexDigit(char c) {
  return isDigit(c) || (c >= 'a' && c <= 'f') || (c >= 'A' && c <= 'F');
}
bool isOneOf(char c, std::string_view set) {
  return set.find(c) != std::string_view::npos;
}

bool isQueryCharacter(char c) {
  return isLetter(c) || isDigit(c) || isOneOf(c, "-._~!$&'()*+,;=:@/?");
}
bool isSchemeCharacter(char c) {
  return isLetter(c) || isDigit(c) || isOneOf(c, "+-.");
}

}  // namespace

std::string percentEncodeForQuery(std::string_view text) {
  return platform::percentEncode(text, isQueryCharacter);
}

std::string_view lastPathComponent(std::string_view path) {
  while (path.size() > 1 && path.back() == '/') path.remove_suffix(1);
  const std::size_t slash = path.rfind('/');
  return slash == std::string_view::npos || path.size() == 1 ? path : path.substr(slash + 1);
}

std::string fileUploadURL(std::string_view uploadURL, std::string_view deviceID, std::uint32_t sessionID,
                          std::string_view path) {
  const std::string fileName = std::string(lastPathComponent(path)) + ".gz";
  return fmt::format("{}?uuid={}&sequence={}&description={}%20(Uploaded%20by%20HQX)&filename={}&raw=true", uploadURL,
                     deviceID, sessionID, percentEncodeForQuery(kDescription), percentEncodeForQuery(fileName));
}

bool isValidURL(std::string_view text) {
  const std::size_t colon = text.find("://");
  if (colon == 0 || colon == std::string_view::npos) return false;
  const std::string_view scheme = text.substr(0, colon);
  if (!isLetter(scheme.front()) || !std::all_of(scheme.begin(), scheme.end(), isSchemeCharacter)) return false;
  const std::string_view rest = text.substr(colon + 3);
  if (rest.empty() || isOneOf(rest.front(), "/?#:")) return false;  // no host
  for (std::size_t i = 0; i < rest.size(); ++i) {
    if (rest[i] == '%') {
      if (i + 2 >= rest.size() || !isHexDigit(rest[i + 1]) || !isHexDigit(rest[i + 2])) return false;
    } else if (!isQueryCharacter(rest[i]) && !isOneOf(rest[i], "#[]")) {
      return false;
    }
  }
  return true;
}

}  // namespace orvanta
