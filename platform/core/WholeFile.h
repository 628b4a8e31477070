#pragma once

#include <cstddef>
#include <string>

#include "platform/core/Result.h"

namespace orvanta::platform {

// Reads a descriptor from its position to its end. The failure is the reason alone.
Result<std::string> readToEnd(int fd, std::size_t maximumBytes);
// Reads a file that a user has named; waits for a pipe. The failure names the path; a directory is a failure, too.
Result<std::string> readWholeFile(const std::string& path, std::size_t maximumBytes);

}  // namespace orvanta::platform
