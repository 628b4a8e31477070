#pragma once

#include <cstdint>
#include <string>

#include "interface/ClientSessionInterface.h"

namespace orvanta::ctl {

// The lines that `orvantactl watch` writes, without their ends.
std::string aggregatedEventLine(const AggregatedEvent& event);
std::string watchingLine(const std::string& token, std::uint32_t level);

}  // namespace orvanta::ctl
