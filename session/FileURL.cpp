#include "session/FileURL.h"

namespace orvanta {

namespace {

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

}  // namespace

std::optional<std::string> pathOfFileURL(std::string_view url) {
  constexpr std::string_view kScheme = "file://";
  if (url.substr(0, kScheme.size()) != kScheme) return std::nullopt;
  std::string_view rest = url.substr(kScheme.size());
  constexpr std::string_view kLocalhost = "localhost/";
  if (rest.substr(0, kLocalhost.size()) == kLocalhost) rest.remove_prefix(kLocalhost.size() - 1);
  if (rest.empty() || rest.front() != '/') return std::nullopt;

  std::string path;
  path.reserve(rest.size());
  for (std::size_t i = 0; i < rest.size(); ++i) {
    if (rest[i] != '%') {
      path += rest[i];
      continue;
    }
    if (i + 2 >= rest.size()) return std::nullopt;
    const int high = hexDigit(rest[i + 1]);
    const int low = hexDigit(rest[i + 2]);
    if (high < 0 || low < 0 || (high == 0 && low == 0)) return std::nullopt;
    path += static_cast<char>(high * 16 + low);
    i += 2;
  }
  if (path.find('\0') != std::string::npos) return std::nullopt;
  return path;
}

}  // namespace orvanta
