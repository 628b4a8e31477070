#include "platform/MessagePack.h"

#include <gtest/gtest.h>

#include <cmath>
#include <ctime>
#include <limits>
#include <msgpack.hpp>

#include "tests/platform/RandomValue.h"
#include "tests/support/Bytes.h"

namespace platform {
namespace {

using orvanta::test::fromHex;
using orvanta::test::toHex;

std::vector<std::uint8_t> encode(const Value& value) {
  std::vector<std::uint8_t> bytes;
  MessagePackWriter(bytes).value(value);
  return bytes;
}

constexpr std::int64_t kMinimum = std::numeric_limits<std::int64_t>::min();

TEST(MessagePack, WritesTheShortestFormAndReadsIt) {
  const std::pair<Value, const char*> rows[] = {
      {Value(), "c0"},
      {false, "c2"},
      {true, "c3"},
      {0, "00"},
      {127, "7f"},
      {128, "cc 80"},
      {255, "cc ff"},
      {256, "cd 01 00"},
      {65536, "ce 00 01 00 00"},
      {std::int64_t{4294967296}, "cf 00 00 00 01 00 00 00 00"},
      {std::uint64_t{18446744073709551615U}, "cf ff ff ff ff ff ff ff ff"},
      {-1, "ff"},
      {-32, "e0"},
      {-33, "d0 df"},
      {-128, "d0 80"},
      {-129, "d1 ff 7f"},
      {-32769, "d2 ff ff 7f ff"},
      {std::int64_t{-2147483649}, "d3 ff ff ff ff 7f ff ff ff"},
      {kMinimum, "d3 80 00 00 00 00 00 00 00"},
      {1.5, "cb 3f f8 00 00 00 00 00 00"},
      {std::numeric_limits<double>::infinity(), "cb 7f f0 00 00 00 00 00 00"},
      {"", "a0"},
      {"é", "a2 c3 a9"},
      {Data{{1, 2}}, "c4 02 01 02"},
      {Date{1}, "d6 ff 00 00 00 01"},
      {Date{1.5}, "d7 ff 77 35 94 00 00 00 00 01"},
      {Date{17179869183.0}, "d7 ff 00 00 00 03 ff ff ff ff"},
      {Date{17179869184.0}, "c7 0c ff 00 00 00 00 00 00 00 04 00 00 00 00"},
      {Date{-0.25}, "c7 0c ff 2c b4 17 80 ff ff ff ff ff ff ff ff"},
      {Array{}, "90"},
      {Array{1, Array{}}, "92 01 90"},
      {Dictionary{{"b", 1}, {"a", nullptr}}, "82 a1 61 c0 a1 62 01"},
  };
  for (const auto& [value, hex] : rows) {
    EXPECT_EQ(toHex(encode(value)), hex) << value.description();
    const Result<Value> decoded = decodeMessagePack(fromHex(hex));
    ASSERT_TRUE(decoded.ok()) << hex << ": " << decoded.error();
    EXPECT_EQ(*decoded, value) << hex;
  }
}

TEST(MessagePack, ChoosesTheLengthFormAtItsBorders) {
  const std::pair<Value, const char*> rows[] = {
      {std::string(31, 'x'), "bf"},
      {std::string(32, 'x'), "d9 20"},
      {std::string(255, 'x'), "d9 ff"},
      {std::string(256, 'x'), "da 01 00"},
      {std::string(65536, 'x'), "db 00 01 00 00"},
      {Data{std::vector<std::uint8_t>(256)}, "c5 01 00"},
      {Data{std::vector<std::uint8_t>(65536)}, "c6 00 01 00 00"},
      {Array(15), "9f"},
      {Array(16), "dc 00 10"},
      {Array(65536), "dd 00 01 00 00"},
  };
  for (const auto& [value, head] : rows) {
    const std::vector<std::uint8_t> bytes = encode(value);
    EXPECT_EQ(toHex({bytes.data(), fromHex(head).size()}), head);
    EXPECT_EQ(*decodeMessagePack(bytes), value);
  }
  std::vector<std::uint8_t> map;
  MessagePackWriter(map).mapHeader(16);
  EXPECT_EQ(toHex(map), "de 00 10");
}

TEST(MessagePack, ReadsLongerFormsThanNeeded) {
  const std::pair<const char*, Value> rows[] = {
      {"cc 05", 5},
      {"cf 00 00 00 00 00 00 00 05", 5},
      {"d0 05", 5},
      {"d3 00 00 00 00 00 00 00 05", 5},
      {"d1 ff ff", -1},
      {"d9 01 61", "a"},
      {"db 00 00 00 01 61", "a"},
      {"dc 00 01 c0", Array{nullptr}},
      {"dd 00 00 00 00", Array{}},
      {"df 00 00 00 01 a1 61 01", Dictionary{{"a", 1}}},
      {"82 a1 62 01 a1 61 02", Dictionary{{"a", 2}, {"b", 1}}},
      {"c7 04 ff 00 00 00 01", Date{1}},
      {"c8 00 08 ff 00 00 00 00 00 00 00 01", Date{1}},
  };
  for (const auto& [hex, expected] : rows) {
    const Result<Value> decoded = decodeMessagePack(fromHex(hex));
    ASSERT_TRUE(decoded.ok()) << hex << ": " << decoded.error();
    EXPECT_EQ(*decoded, expected) << hex;
  }
}

TEST(MessagePack, RefusesWithThePlace) {
  const std::pair<const char*, const char*> rows[] = {
      {"", "truncated"},
      {"cd 01", "truncated"},
      {"a3 61 62", "truncated"},
      {"c4 02 01", "truncated"},
      {"92 01", "truncated"},
      {"81 a1 61", "truncated"},
      {"d6 ff 00", "truncated"},
      {"dd ff ff ff ff", "bytes in memory"},
      {"df ff ff ff ff a0 00", "bytes in memory"},
      {"db ff ff ff ff 61", "bytes in memory"},
      {"db 00 ff ff ff 61", "truncated"},
      {"c6 00 ff ff ff 61", "truncated"},
      {"c9 ff ff ff ff ff", "truncated"},
      {"c1", "byte 0"},
      {"92 01 c1", "byte 2"},
      {"01 02", "behind the value at byte 1"},
      {"91 ca 3f 80 00 00", "float32"},
      {"d4 05 00", "extension type 5 at byte 0"},
      {"91 d4 80 00", "extension type -128 at byte 1"},
      {"d5 ff 00 00", "timestamp of 2 bytes"},
      {"c7 00 ff", "timestamp of 0 bytes"},
      {"d7 ff ee 6b 28 00 00 00 00 00", "1000000000 nanoseconds"},
      {"81 01 02", "key that is not text at byte 1"},
      {"81 c4 01 61 02", "key that is not text at byte 1"},
      {"82 a1 61 01 a1 61 02", "\"a\" twice at byte 0"},
      {"91 83 a1 62 01 a1 61 02 a1 62 03", "\"b\" twice at byte 1"},
      {"a1 ff", "not UTF-8 at byte 1"},
      {"81 a2 c3 28 00", "not UTF-8 at byte 2"},
  };
  for (const auto& [hex, expected] : rows) {
    const Result<Value> decoded = decodeMessagePack(fromHex(hex));
    ASSERT_FALSE(decoded.ok()) << hex;
    EXPECT_NE(decoded.error().find(expected), std::string::npos) << hex << ": " << decoded.error();
  }
}

TEST(MessagePack, BoundsDepthAndMemory) {
  const auto nested = [](std::size_t depth, const char* open) {
    std::vector<std::uint8_t> bytes;
    const std::vector<std::uint8_t> piece = fromHex(open);
    for (std::size_t i = 1; i < depth; ++i) {
      bytes.insert(bytes.end(), piece.begin(), piece.end());
    }
    bytes.push_back(0x90);
    return bytes;
  };
  for (const char* open : {"91", "81 a0"}) {
    EXPECT_TRUE(decodeMessagePack(nested(64, open)).ok());
    EXPECT_NE(decodeMessagePack(nested(65, open)).error().find("deeper than 64"), std::string::npos);
    EXPECT_FALSE(decodeMessagePack(nested(1'000'000, open)).ok());
  }
  const MessagePackLimits small{64, 10'000};
  EXPECT_TRUE(decodeMessagePack(encode(Array(200)), small).ok());
  EXPECT_FALSE(decodeMessagePack(encode(Array(300)), small).ok());
  EXPECT_FALSE(decodeMessagePack(encode(Array(20, Array(20))), small).ok());
  EXPECT_FALSE(decodeMessagePack(encode(std::string(10'000, 'x')), small).ok());
}

// Claims that would take terabytes must cost nothing while their bytes are missing, whatever the memory limit says.
TEST(MessagePack, AllocatesNothingForMissingBytes) {
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
    const Result<Value> decoded = decodeMessagePack(encode(Date{given}));
    ASSERT_TRUE(decoded.ok()) << decoded.error();
    EXPECT_EQ(*decoded, Value(Date{expected})) << given;
  }
}

// What the reference library read, as a value of ours; what it cannot have read is null.
Value asValue(const msgpack::object& object) {
  switch (object.type) {
    case msgpack::type::BOOLEAN:
      return object.via.boolean;
    case msgpack::type::POSITIVE_INTEGER:
      return object.via.u64;
    case msgpack::type::NEGATIVE_INTEGER:
      return object.via.i64;
    case msgpack::type::FLOAT64:
      return object.via.f64;
    case msgpack::type::STR:
      return std::string_view(object.via.str.ptr, object.via.str.size);
    case msgpack::type::BIN:
      return Data{{object.via.bin.ptr, object.via.bin.ptr + object.via.bin.size}};
    case msgpack::type::EXT: {
      const auto time = object.as<timespec>();
      return Date{static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9};
    }
    case msgpack::type::ARRAY: {
      Array array;
      for (std::uint32_t i = 0; i < object.via.array.size; ++i) array.push_back(asValue(object.via.array.ptr[i]));
      return array;
    }
    case msgpack::type::MAP: {
      Dictionary dictionary;
      for (std::uint32_t i = 0; i < object.via.map.size; ++i) {
        dictionary.set(object.via.map.ptr[i].key.as<std::string>(), asValue(object.via.map.ptr[i].val));
      }
      return dictionary;
    }
    default:
      return nullptr;
  }
}

TEST(MessagePack, AgreesWithTheReferenceLibraryBothWays) {
  orvanta::test::RandomValues values(2);
  for (int i = 0; i < 400; ++i) {
    const Value value = values.next();
    const std::vector<std::uint8_t> bytes = encode(value);
    const auto unpacked = msgpack::unpack(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    EXPECT_EQ(asValue(unpacked.get()), value);
    EXPECT_EQ(*decodeMessagePack(bytes), value);

    // Which packs whole doubles as integers.
    msgpack::sbuffer packed;
    msgpack::pack(packed, unpacked.get());
    const Result<Value> decoded =
        decodeMessagePack({reinterpret_cast<const std::uint8_t*>(packed.data()), packed.size()});
    ASSERT_TRUE(decoded.ok()) << decoded.error();
    EXPECT_EQ(*decoded, asValue(msgpack::unpack(packed.data(), packed.size()).get()));
  }
}

}  // namespace
}  // namespace platform
