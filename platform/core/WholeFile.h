#pragma once

#include <cstddef>
#include <string>

#include "platform/core/Result.h"

namespace orvanta::platform {

// Reads a descriptor from its position to its end. The failure is the reason alone.
Result<std::string> readToEnd(int fd, std::size_t maximumBytes);
// What a user has named, a pipe included, for which it waits. The failure names the path; a directory is one.
Result<std::string> readWholeFile(const std::string& path, std::size_t maximumBytes);

}  // namespace orvanta::platform
