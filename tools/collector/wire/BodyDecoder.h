#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "interface/Values.h"

namespace orvanta::collector {

// Inflates a gzip or zlib body whole; a failure when it is damaged, has trailing bytes, or would pass `maximumBytes`.
Result<std::string> inflateBody(std::string_view compressed, std::size_t maximumBytes);

}  // namespace orvanta::collector
