#include "config/Conversions.h"

#include <arpa/inet.h>

#include <cmath>
#include <cstddef>
#include <cstring>

namespace orvanta {

double timevalToSeconds(platform::TimeValue time) {
  return time.seconds + time.microseconds / 1000000.0;
}

double sanitizeDouble(double value) {
  return std::isfinite(value) ? value : -1.0;
}

std::int32_t roundDownToMinute(std::int32_t seconds) {
  return seconds / 60 * 60;
}

sockaddr_in makeIPv4SocketAddress(std::string_view address, std::uint16_t port) {
  constexpr std::size_t kLongestDottedQuad = INET_ADDRSTRLEN - 1;
  sockaddr_in result{};
  result.sin_family = AF_INET;
  result.sin_port = htons(port);
  char text[INET_ADDRSTRLEN] = {};
  if (address.size() <= kLongestDottedQuad) std::memcpy(text, address.data(), address.size());
  if (::inet_pton(AF_INET, text, &result.sin_addr) != 1) result.sin_addr.s_addr = INADDR_NONE;
  return result;
}

}  // namespace orvanta
