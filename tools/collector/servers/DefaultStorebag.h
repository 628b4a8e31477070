#pragma once

#include <string_view>

namespace orvanta::collector {

// The bag that a collector starts with: every section a working example that posts to the collector itself.
std::string_view defaultStorebagJson();

}  // namespace orvanta::collector
