#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace orvanta {

// The path of a file URL with its percent escapes decoded: "file:///tmp/a%20b" and "file://localhost/tmp/a%20b" give
// "/tmp/a b". None for other schemes and hosts, relative paths, malformed escapes and a NUL.
std::optional<std::string> pathOfFileURL(std::string_view url);

}  // namespace orvanta
