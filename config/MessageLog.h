#pragma once

#include <string>
#include <string_view>

#include "config/Platform.h"

namespace orvanta {

// Appends one line to the message log, which is created, replaced and expired as needed. The file is opened, written
// and closed by each call; no state is kept in memory. Any thread; failures are logged and lose the line.
void writeToLogFile(Platform& platform, std::string_view message);

}  // namespace orvanta
