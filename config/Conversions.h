#pragma once

#include <netinet/in.h>

#include <cstdint>
#include <string_view>

#include "platform/core/Clock.h"

namespace orvanta {

// seconds + microseconds / 1e6.
double timevalToSeconds(platform::TimeValue time);
// -1.0 for what is not a finite number.
double sanitizeDouble(double value);
// (seconds / 60) * 60, truncating toward zero.
std::int32_t roundDownToMinute(std::int32_t seconds);
// A dotted quad of at most 15 characters; a text that does not parse, or is longer, gives the all-ones address.
sockaddr_in makeIPv4SocketAddress(std::string_view address, std::uint16_t port);

}  // namespace orvanta
