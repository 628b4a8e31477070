#include "config/Conversions.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <limits>
#include <tuple>

#include "config/ClientTypes.h"

namespace orvanta {
namespace {

TEST(Conversions, timevalToSeconds) {
  const std::pair<platform::TimeValue, double> rows[] = {
      {{1, 500000}, 1.5}, {{0, 0}, 0}, {{-1, 250000}, -0.75}, {{2147483647, 999999}, 2147483647.999999}};
  for (const auto& [time, expected] : rows) EXPECT_DOUBLE_EQ(timevalToSeconds(time), expected);
}

TEST(Conversions, sanitizeDouble) {
  using Limits = std::numeric_limits<double>;
  for (const double finite : {-2.0, 0.0, Limits::max(), Limits::denorm_min()})
    EXPECT_EQ(sanitizeDouble(finite), finite);
  for (const double other : {Limits::quiet_NaN(), Limits::infinity(), -Limits::infinity()}) {
    EXPECT_EQ(sanitizeDouble(other), -1) << other;
  }
}

TEST(Conversions, roundDownToMinuteTruncatesTowardZero) {
  const std::pair<std::int32_t, std::int32_t> rows[] = {
      {119, 60}, {60, 60}, {59, 0}, {-59, 0}, {-61, -60}, {2147483647, 2147483640}, {-2147483648, -2147483640}};
  for (const auto& [given, expected] : rows) EXPECT_EQ(roundDownToMinute(given), expected) << given;
}

TEST(Conversions, makeIPv4SocketAddress) {
  const auto check = [](const char* text, std::uint32_t expected) {
    const sockaddr_in address = makeIPv4SocketAddress(text, 5000);
    EXPECT_EQ(address.sin_family, AF_INET);
    EXPECT_EQ(ntohl(address.sin_addr.s_addr), expected) << text;
    EXPECT_EQ(ntohs(address.sin_port), 5000);
  };
  check("255.255.255.254", 0xfffffffe);
  check("0.0.0.0", 0);
  for (const char* unparsable :
       {"", "10.0.0", "10.0.0.256", "10.0.0.1 ", "::1", "host.kovalt", "127.0.0.1.127.0.0.1"}) {
    check(unparsable, 0xffffffff);
  }
}

TEST(ClientTypes, namesEveryTypesSenderAndStorebag) {
  const std::tuple<std::int32_t, const char*, const char*> rows[] = {
      {0, "QZ", ""},
      {1, "XJ", ""},
      {2, "ZUV", ""},
      {3, "JQ", ""},
      {4, "VX", ""},
      {5, "ZK", "quillon"},
      {6, "QB", "brindle"},
      {7, "XF", "confluo"},
      {8, "JZ", "skylume"},
      {9, "QW", "ostrel"},
      {10, "XQ", "pondera"},
      {11, "ZJ", "confluo"},
      {12, "QUBZ", "graphelle"},
      {13, "ZEPHQ", "confluo"},
      {14, "QB-ZIRL", "brindle"},
      {15, "QB-JOVEX", "brindle"},
      {16, "ZORNEPS", "scribehall"},
      {17, "JAXTRO", "halvora"},
      {18, "QUARNEX", "parrowick"},
      {19, "", ""},
      {-1, "", ""},
      {std::numeric_limits<std::int32_t>::max(), "", ""}};
  for (const auto& [clientType, sender, storebag] : rows) {
    EXPECT_EQ(senderCodeForClientType(clientType), sender) << clientType;
    EXPECT_EQ(storebagNameForClientType(clientType).value_or(""), storebag) << clientType;
  }
}

}  // namespace
}  // namespace orvanta
