#include "platform/core/PropertyListDate.h"

#include <chrono>
#include <cmath>
#include <cstdint>

#include <fmt/format.h>

namespace orvanta::platform {

namespace {

constexpr double kEarliest = -62135596800.0;  // 0001-01-01T00:00:00Z
constexpr double kEnd = 253402300800.0;       // 10000-01-01T00:00:00Z
constexpr std::string_view kForm = "dddd-dd-ddTdd:dd:ddZ";

unsigned number(std::string_view digits) {
  unsigned result = 0;
  for (const char c : digits) result = result * 10 + static_cast<unsigned>(c - '0');
  return result;
}

}  // namespace

std::optional<double> parsePropertyListDate(std::string_view text) {
  using namespace std::chrono;
  if (text.size() != kForm.size()) return std::nullopt;
  for (std::size_t i = 0; i < kForm.size(); ++i) {
    const bool isDigit = text[i] >= '0' && text[i] <= '9';
    if (kForm[i] == 'd' ? !isDigit : text[i] != kForm[i]) return std::nullopt;
  }
  const year_month_day date{year(static_cast<int>(number(text.substr(0, 4)))), month(number(text.substr(5, 2))),
                            day(number(text.substr(8, 2)))};
  const unsigned hour = number(text.substr(11, 2));
  const unsigned minute = number(text.substr(14, 2));
  const unsigned second = number(text.substr(17, 2));
  if (!date.ok() || date.year() < year(1) || hour > 23 || minute > 59 || second > 59) return std::nullopt;
  const sys_seconds moment = sys_days(date) + hours(hour) + minutes(minute) + seconds(second);
  return static_cast<double>(moment.time_since_epoch().count());
}

std::optional<std::string> formatPropertyListDate(double secondsSince1970) {
  using namespace std::chrono;
  if (!(secondsSince1970 >= kEarliest && secondsSince1970 < kEnd)) return std::nullopt;
  const sys_seconds moment{seconds(static_cast<std::int64_t>(std::floor(secondsSince1970)))};
  const sys_days midnight = floor<days>(moment);
  const year_month_day date(midnight);
  const hh_mm_ss time(moment - midnight);
  return fmt::format("{:04}-{:02}-{:02}T{:02}:{:02}:{:02}Z", static_cast<int>(date.year()),
                     static_cast<unsigned>(date.month()), static_cast<unsigned>(date.day()), time.hours().count(),
                     time.minutes().count(), time.seconds().count());
}

}  // namespace orvanta::platform
