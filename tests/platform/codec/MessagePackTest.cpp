#include "platform/codec/MessagePack.h"

#include <cmath>
#include <limits>

#include "tests/platform/codec/CodecRows.h"
#include "tests/support/Bytes.h"

namespace orvanta::platform {
namespace {

using namespace orvanta::test;

constexpr MessagePackLimits kLimits{64, 256U << 20U};

std::vector<std::uint8_t> encode(const Value& value) {
  std::vector<std::uint8_t> bytes;
  MessagePackWriter(bytes).value(value);
  return bytes;
}

Result<Value> decode(const std::string& hex) {
  return decodeMessagePack(fromHex(hex), kLimits);
}

// The bytes' beginning; the rest is the text's, the data's or the elements'.
TEST(MessagePack, WritesTheShortestFormAndReadsIt) {
  const std::pair<Value, const char*> rows[] = {
      {Value(), "c0"},
      {false, "c2"},
      {127, "7f"},
      {128, "cc 80"},
      {65536, "ce 00 01 00 00"},
      {std::int64_t{4294967296}, "cf 00 00 00 01 00 00 00 00"},
      {std::uint64_t{18446744073709551615U}, "cf ff ff ff ff ff ff ff ff"},
      {-32, "e0"},
      {-33, "d0 df"},
      {-32769, "d2 ff ff 7f ff"},
      {std::numeric_limits<std::int64_t>::min(), "d3 80 00 00 00 00 00 00 00"},
      {1.5, "cb 3f f8 00 00 00 00 00 00"},
      {"é", "a2 c3 a9"},
      {std::string(31, 'x'), "bf"},
      {std::string(32, 'x'), "d9 20"},
      {std::string(65536, 'x'), "db 00 01 00 00"},
      {Data{{1, 2}}, "c4 02 01 02"},
      {Data{std::vector<std::uint8_t>(65536)}, "c6 00 01 00 00"},
      {Date{1}, "d6 ff 00 00 00 01"},
      {Date{1.5}, "d7 ff 77 35 94 00 00 00 00 01"},
      {Date{17179869184.0}, "c7 0c ff 00 00 00 00 00 00 00 04 00 00 00 00"},
      {Date{-0.25}, "c7 0c ff 2c b4 17 80 ff ff ff ff ff ff ff ff"},
      {Array{1, Array{}}, "92 01 90"},
      {Array(16), "dc 00 10"},
      {Array(65536), "dd 00 01 00 00"},
      {Dictionary{{"b", 1}, {"a", nullptr}}, "82 a1 61 c0 a1 62 01"},
  };
  for (const auto& [value, hex] : rows) {
    const std::vector<std::uint8_t> bytes = encode(value);
    EXPECT_EQ(toHex({bytes.data(), fromHex(hex).size()}), hex);
    EXPECT_EQ(*decodeMessagePack(bytes, kLimits), value) << hex;
  }
  std::vector<std::uint8_t> map;
  MessagePackWriter(map).mapHeader(16);
  EXPECT_EQ(toHex(map), "de 00 10");
}

TEST(MessagePack, RefusesWithThePlace) {
  const RefusedRows<std::string> rows = {
      {"truncated",
       {"", "cd 01", "a3 61 62", "c4 02 01", "92 01", "81 a1 61", "d6 ff 00", "db 00 ff ff ff 61", "c6 00 ff ff ff 61",
        "c9 ff ff ff ff ff"}},
      {"bytes in memory", {"dd ff ff ff ff", "df ff ff ff ff a0 00", "db ff ff ff ff 61"}},
      {"byte 0", {"c1"}},
      {"byte 2", {"92 01 c1"}},
      {"behind the value at byte 1", {"01 02"}},
      {"float32", {"91 ca 3f 80 00 00"}},
      {"extension type 5 at byte 0", {"d4 05 00"}},
      {"timestamp of 2 bytes", {"d5 ff 00 00"}},
      {"1000000000 nanoseconds", {"d7 ff ee 6b 28 00 00 00 00 00"}},
      {"key that is not text at byte 1", {"81 01 02", "81 c4 01 61 02"}},
      {"\"a\" twice at byte 0", {"82 a1 61 01 a1 61 02"}},
      {"not UTF-8 at byte 1", {"a1 ff"}},
  };
  expectRefusals(decode, rows);
}

TEST(MessagePack, BoundsDepthAndMemory) {
  for (const std::string open : {"91", "81 a0"}) {
    std::string deep;
    for (int depth = 1; depth < 64; ++depth) deep += open;
    EXPECT_TRUE(decode(deep + "90").ok());
    EXPECT_NE(decode(deep + open + "90").error().find("deeper than 64"), std::string::npos);
  }
  EXPECT_FALSE(decodeMessagePack(std::vector<std::uint8_t>(1'000'000, 0x91), kLimits).ok());
  const MessagePackLimits small{64, 10'000};
  EXPECT_TRUE(decodeMessagePack(encode(Array(200)), small).ok());
  for (const Value& large : {Value(Array(300)), Value(Array(20, Array(20))), Value(std::string(10'000, 'x'))}) {
    EXPECT_FALSE(decodeMessagePack(encode(large), small).ok());
  }
  // Claims that would take terabytes cost nothing while their bytes are missing, under any limit.
  const MessagePackLimits unlimited{64, std::numeric_limits<std::size_t>::max() / 2};
  for (const char* hex :
       {"dd ff ff ff ff", "df ff ff ff ff", "91 dd 7f ff ff ff 00", "dd 00 00 00 02 dd ff ff ff ff 00"}) {
    EXPECT_NE(decodeMessagePack(fromHex(hex), unlimited).error().find("truncated"), std::string::npos) << hex;
  }
}

TEST(MessagePack, DatesOutsideTheTimestampsRangeAreClamped) {
  const std::pair<double, double> rows[] = {
      {1e300, 0x1p63}, {-1e300, -0x1p63}, {std::nan(""), 0}, {0.9999999999, 1}, {-1e-12, 0}};
  for (const auto& [given, expected] : rows) {
    EXPECT_EQ(*decodeMessagePack(encode(Date{given}), kLimits), Value(Date{expected})) << given;
  }
}

TEST(MessagePack, RoundTrip) {
  expectRoundTrips(
      2, [](const Value& value) { return Result<std::vector<std::uint8_t>>(encode(value)); },
      [](const std::vector<std::uint8_t>& bytes) { return decodeMessagePack(bytes, kLimits); });
}

}  // namespace
}  // namespace orvanta::platform
