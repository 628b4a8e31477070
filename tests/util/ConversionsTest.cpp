#include "util/Conversions.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <limits>

namespace orvanta {
namespace {

TEST(Conversions, timevalToSeconds) {
  struct Row {
    platform::TimeValue time;
    double expected;
  };
  const Row rows[] = {
      {{1, 500000}, 1.5}, {{0, 0}, 0}, {{-1, 250000}, -0.75}, {{2147483647, 999999}, 2147483647.999999}};
  for (const Row& row : rows) EXPECT_DOUBLE_EQ(timevalToSeconds(row.time), row.expected);
}

TEST(Conversions, sanitizeDouble) {
  using Limits = std::numeric_limits<double>;
  struct Row {
    double given, expected;
  };
  const Row rows[] = {{Limits::quiet_NaN(), -1},
                      {Limits::infinity(), -1},
                      {-Limits::infinity(), -1},
                      {-1, -1},
                      {0, 0},
                      {Limits::max(), Limits::max()},
                      {Limits::denorm_min(), Limits::denorm_min()}};
  for (const Row& row : rows) EXPECT_EQ(sanitizeDouble(row.given), row.expected) << row.given;
}

TEST(Conversions, roundDownToMinuteTruncatesTowardZero) {
  struct Row {
    std::int32_t given, expected;
  };
  const Row rows[] = {
      {119, 60}, {60, 60}, {59, 0}, {-59, 0}, {-61, -60}, {2147483647, 2147483640}, {-2147483648, -2147483640}};
  for (const Row& row : rows) EXPECT_EQ(roundDownToMinute(row.given), row.expected) << row.given;
}

TEST(Conversions, makeIPv4SocketAddress) {
  struct Row {
    std::string_view text;
    std::uint32_t expected;  // in network order when read from high to low
  };
  const Row rows[] = {
      {"10.0.0.1", 0x0a000001},
      {"255.255.255.254", 0xfffffffe},
      {"0.0.0.0", 0},
      {"", 0xffffffff},
      {"10.0.0", 0xffffffff},
      {"10.0.0.256", 0xffffffff},
      {"10.0.0.1 ", 0xffffffff},
      {"::1", 0xffffffff},
      {"host.kovalt", 0xffffffff},
      {"10.0.0.1/nothing", 0xffffffff},
      {"100.100.100.1000", 0xffffffff},
      {"127.0.0.1.127.0.0.1", 0xffffffff},
  };
  for (const Row& row : rows) {
    const sockaddr_in address = makeIPv4SocketAddress(row.text, 5000);
    EXPECT_EQ(address.sin_family, 2);
    EXPECT_EQ(ntohl(address.sin_addr.s_addr), row.expected) << row.text;
    const auto* port = reinterpret_cast<const unsigned char*>(&address.sin_port);
    EXPECT_EQ(port[0], 0x13);
    EXPECT_EQ(port[1], 0x88);
  }
}

}  // namespace
}  // namespace orvanta
