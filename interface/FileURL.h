#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace orvanta {

// "file:///tmp/a%20b.log" for "/tmp/a b.log"; every byte outside the unreserved characters and the slash is encoded.
std::string fileURLForPath(std::string_view absolutePath);
// Back again. Returns nullopt for another scheme, a host other than "localhost", a path that is not absolute or
// contains a NUL, and broken percent-encoding.
std::optional<std::string> pathForFileURL(std::string_view url);

}  // namespace orvanta
