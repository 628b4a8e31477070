#include "interface/FileURL.h"

#include "platform/core/Text.h"

namespace orvanta {

namespace {

bool isDigitOrLetter(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

// The unreserved characters and the slash.
bool isKept(char c) {
  return isDigitOrLetter(c) || c == '-' || c == '.' || c == '_' || c == '~' || c == '/';
}

bool isHexDigit(char c) {
  return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f') || (c >= 'A' && c <= 'F');
}

bool isWellEncoded(std::string_view text) {
  for (auto at = text.find('%'); at != std::string_view::npos; at = text.find('%', at + 1)) {
    if (at + 2 >= text.size() || !isHexDigit(text[at + 1]) || !isHexDigit(text[at + 2])) return false;
  }
  return true;
}

}  // namespace

std::string fileURLForPath(std::string_view absolutePath) {
  return "file://" + platform::percentEncode(absolutePath, isKept);
}

std::optional<std::string> pathForFileURL(std::string_view url) {
  constexpr std::string_view kScheme = "file://";
  constexpr std::string_view kLocalHost = "localhost";
  if (!url.starts_with(kScheme)) return std::nullopt;
  url.remove_prefix(kScheme.size());
  if (url.starts_with(kLocalHost)) url.remove_prefix(kLocalHost.size());
  if (!url.starts_with('/') || !isWellEncoded(url)) return std::nullopt;
  auto path = platform::percentDecode(url);
  if (path.find('\0') != std::string::npos) return std::nullopt;
  return path;
}

}  // namespace orvanta
