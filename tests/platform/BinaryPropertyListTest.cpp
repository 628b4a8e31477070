#include <gtest/gtest.h>

#include <limits>

#include "platform/PropertyList.h"
#include "tests/platform/RandomValue.h"
#include "tests/support/Bytes.h"

namespace platform {
namespace {

using orvanta::test::fromHex;
using orvanta::test::toHex;
using Bytes = std::vector<std::uint8_t>;

// A document of these objects, the first one on top, with offsets and references of one byte.
Bytes document(std::initializer_list<const char*> objects) {
  Bytes bytes = fromHex("'bplist00'");
  Bytes offsets;
  for (const char* object : objects) {
    offsets.push_back(static_cast<std::uint8_t>(bytes.size()));
    const Bytes content = fromHex(object);
    bytes.insert(bytes.end(), content.begin(), content.end());
  }
  const auto table = static_cast<std::uint8_t>(bytes.size());
  bytes.insert(bytes.end(), offsets.begin(), offsets.end());
  const Bytes trailer = fromHex("00 00 00 00 00 00 01 01");
  bytes.insert(bytes.end(), trailer.begin(), trailer.end());
  for (const std::uint8_t field : {static_cast<std::uint8_t>(objects.size()), std::uint8_t{0}, table}) {
    bytes.insert(bytes.end(), 7, 0);
    bytes.push_back(field);
  }
  return bytes;
}

TEST(BinaryPropertyList, ReadsEveryObject) {
  const std::pair<Bytes, Value> rows[] = {
      {document({"00"}), Value()},
      {document({"08"}), false},
      {document({"09"}), true},
      {document({"10 ff"}), 255},
      {document({"11 80 00"}), 32768},
      {document({"12 ff ff ff ff"}), 4294967295U},
      {document({"13 ff ff ff ff ff ff ff fe"}), -2},
      {document({"14 00 00 00 00 00 00 00 00 ff ff ff ff ff ff ff ff"}), std::uint64_t{18446744073709551615U}},
      {document({"14 ff ff ff ff ff ff ff ff 80 00 00 00 00 00 00 00"}), std::numeric_limits<std::int64_t>::min()},
      {document({"22 3f c0 00 00"}), 1.5},
      {document({"23 bf f8 00 00 00 00 00 00"}), -1.5},
      {document({"33 00 00 00 00 00 00 00 00"}), Date{978307200}},
      {document({"33 c1 cd 27 e4 40 00 00 00"}), Date{0}},
      {document({"42 00 ff"}), Data{{0, 0xff}}},
      {document({"53 'abc'"}), "abc"},
      {document({"5f 10 03 'abc'"}), "abc"},
      {document({"5f 13 00 00 00 00 00 00 00 03 'abc'"}), "abc"},
      {document({"64 00 e9 20 ac d8 34 dd 1e"}), "é€𝄞"},
      {document({"a2 01 01", "09"}), Array{true, true}},
      {document({"b1 01", "09"}), Array{true}},
      {document({"c1 01", "09"}), Array{true}},
      {document({"d2 01 02 03 04", "51 'b'", "51 'a'", "10 01", "10 02"}), Dictionary{{"a", 2}, {"b", 1}}},
      {document({"d1 01 02", "61 00 e9", "d0"}), Dictionary{{"é", Dictionary{}}}},
  };
  for (const auto& [bytes, expected] : rows) {
    const Result<Value> parsed = parseBinaryPropertyList(bytes);
    ASSERT_TRUE(parsed.ok()) << toHex(bytes) << ": " << parsed.error();
    EXPECT_EQ(*parsed, expected) << toHex(bytes);
  }
}

TEST(BinaryPropertyList, RefusesObjectsWithThePlace) {
  const std::pair<Bytes, const char*> rows[] = {
      {document({"0f"}), "unknown object type 0x0f at byte 8"},
      {document({"0c"}), "unknown object type 0x0c"},
      {document({"73 'abc'"}), "unknown object type 0x73"},
      {document({"e0"}), "unknown object type 0xe0"},
      {document({"80 01"}), "a UID"},
      {document({"15"
                 "00000000000000000000000000000000"
                 "00000000000000000000000000000000"}),
       "more than 16 bytes"},
      {document({"14 00 00 00 00 00 00 00 01 00 00 00 00 00 00 00 00"}), "more than 64 bits at byte 8"},
      {document({"14 ff ff ff ff ff ff ff ff 00 00 00 00 00 00 00 00"}), "more than 64 bits"},
      {document({"11 00"}), "integer that ends too late"},
      {document({"21 00 00"}), "other than 4 or 8 bytes"},
      {document({"23 00"}), "real number that ends too late"},
      {document({"32 00 00 00 00"}), "date of other than 8 bytes"},
      {document({"33 7f f0 00 00 00 00 00 00"}), "no finite number"},
      {document({"43 00 00"}), "data that ends too late"},
      {document({"4f 13 ff ff ff ff ff ff ff ff"}), "data that ends too late"},
      {document({"4f 09"}), "count that is no integer at byte 9"},
      {document({"4f 14 00 00 00 00 00 00 00 00 00 00 00 00 00 00 00 00"}), "count that is no integer"},
      {document({"4f 11 00"}), "count that is no integer"},
      {document({"4f"}), "count that is no integer"},
      {document({"52 'a'"}), "text that ends too late"},
      {document({"51 ff"}), "ASCII text with other bytes"},
      {document({"61 00"}), "text that ends too late"},
      {document({"6f 13 80 00 00 00 00 00 00 01 00 41"}), "text that ends too late"},
      {document({"62 d8 34 00 41"}), "high surrogate without a low one at byte 9"},
      {document({"61 d8 34"}), "high surrogate without a low one"},
      {document({"62 00 41 dd 1e"}), "low surrogate without a high one at byte 11"},
      {document({"a1 05"}), "reference to object 5 of 1 at byte 9"},
      {document({"a2 01", "09"}), "reference"},
      {document({"af 13 7f ff ff ff ff ff ff ff"}), "references that end too late"},
      {document({"d1 01"}), "references that end too late"},
      {document({"d1 01 02", "10 01", "09"}), "key that is no text at byte 11"},
      {document({"d2 01 02 03 03", "51 'a'", "51 'a'", "09"}), "same key twice at byte 8"},
      {document({"d2 01 01 02 02", "51 'a'", "09"}), "same key twice"},
      {document({"a1 00"}), "contains itself at byte 8"},
      {document({"a1 01", "d1 02 00", "51 'a'"}), "contains itself at byte 8"},
  };
  for (const auto& [bytes, expected] : rows) {
    const Result<Value> parsed = parseBinaryPropertyList(bytes);
    ASSERT_FALSE(parsed.ok()) << toHex(bytes);
    EXPECT_NE(parsed.error().find(expected), std::string::npos) << toHex(bytes) << ": " << parsed.error();
  }
}

TEST(BinaryPropertyList, RefusesTrailersThatLie) {
  const Bytes good = document({"a1 01", "09"});
  ASSERT_TRUE(parseBinaryPropertyList(good).ok());
  const std::size_t trailer = good.size() - 32;
  struct Row {
    std::size_t offset;
    const char* bytes;
    const char* expected;
  };
  const Row rows[] = {
      {0, "'bplist01'", "not a \"bplist00\""},
      {trailer + 6, "00", "offset size"},
      {trailer + 6, "09", "offset size"},
      {trailer + 6, "02", "offset table outside"},
      {trailer + 7, "00", "reference size"},
      {trailer + 7, "09", "reference size"},
      {trailer + 8, "ff ff ff ff ff ff ff ff", "offset table outside"},
      {trailer + 8, "00 00 00 00 00 00 00 03", "offset table outside"},
      {trailer + 8, "00 00 00 00 00 00 00 00", "top object"},
      {trailer + 16, "00 00 00 00 00 00 00 02", "top object"},
      {trailer + 24, "ff ff ff ff ff ff ff ff", "offset table outside"},
      {trailer + 24, "00 00 00 00 00 00 00 00", "offset table outside"},
      {trailer - 1, "ff", "offset outside the objects"},
      {trailer - 1, "00", "offset outside the objects"},
  };
  for (const Row& row : rows) {
    Bytes bytes = good;
    const Bytes change = fromHex(row.bytes);
    std::copy(change.begin(), change.end(), bytes.begin() + static_cast<std::ptrdiff_t>(row.offset));
    const Result<Value> parsed = parseBinaryPropertyList(bytes);
    ASSERT_FALSE(parsed.ok()) << row.expected;
    EXPECT_NE(parsed.error().find(row.expected), std::string::npos) << parsed.error();
  }
  for (std::size_t size = 0; size < good.size(); ++size)
    EXPECT_FALSE(parseBinaryPropertyList({good.data(), size}).ok());
}

// Twenty arrays of which each holds the next one ten times: a few hundred bytes that stand for 10^20 values.
TEST(BinaryPropertyList, CountsSharedObjectsEachTime) {
  Bytes bytes = fromHex("'bplist00'");
  Bytes offsets;
  for (std::uint8_t i = 1; i <= 20; ++i) {
    offsets.push_back(static_cast<std::uint8_t>(bytes.size()));
    bytes.push_back(0xaa);
    bytes.insert(bytes.end(), 10, i);
  }
  offsets.push_back(static_cast<std::uint8_t>(bytes.size()));
  bytes.push_back(0x09);
  const Bytes end = document({"09"});
  const auto table = static_cast<std::uint8_t>(bytes.size());
  bytes.insert(bytes.end(), offsets.begin(), offsets.end());
  bytes.insert(bytes.end(), end.end() - 32, end.end());
  bytes[bytes.size() - 17] = 21;
  bytes.back() = table;
  EXPECT_NE(parseBinaryPropertyList(bytes).error().find("more than 1000000 values"), std::string::npos);

  const Bytes shared = document({"a4 01 01 01 01", "5f 10 14 'twenty characters ok'"});
  EXPECT_TRUE(parseBinaryPropertyList(shared, {10, 5, 100}).ok());
  EXPECT_NE(parseBinaryPropertyList(shared, {10, 4, 100}).error().find("more than 4 values"), std::string::npos);
  EXPECT_NE(parseBinaryPropertyList(shared, {10, 5, 79}).error().find("more than 79 bytes"), std::string::npos);
  EXPECT_NE(parseBinaryPropertyList(document({"a1 01", "a1 02", "a0"}), {2, 10, 100}).error().find("deeper than 2"),
            std::string::npos);
}

TEST(BinaryPropertyList, Writes) {
  const std::pair<Value, Bytes> rows[] = {
      {true, document({"09"})},
      {255, document({"10 ff"})},
      {256, document({"11 01 00"})},
      {65536, document({"12 00 01 00 00"})},
      {std::int64_t{1} << 32, document({"13 00 00 00 01 00 00 00 00"})},
      {-1, document({"13 ff ff ff ff ff ff ff ff"})},
      {std::uint64_t{1} << 63U, document({"14 00 00 00 00 00 00 00 00 80 00 00 00 00 00 00 00"})},
      {1.5, document({"23 3f f8 00 00 00 00 00 00"})},
      {Date{978307200}, document({"33 00 00 00 00 00 00 00 00"})},
      {Data{Bytes(15, 7)}, document({"4f 10 0f 07 07 07 07 07 07 07 07 07 07 07 07 07 07 07"})},
      {"é𝄞", document({"63 00 e9 d8 34 dd 1e"})},
      {Array{"a", Dictionary{{"a", "a"}}}, document({"a2 01 02", "51 'a'", "d1 01 01"})},
  };
  for (const auto& [value, expected] : rows) {
    const Result<Bytes> written = writeBinaryPropertyList(value);
    ASSERT_TRUE(written.ok()) << written.error();
    EXPECT_EQ(toHex(*written), toHex(expected)) << value.description();
  }
  const Value refusals[] = {Value(), Array{nullptr}, "\xff", Dictionary{{"\xff", 1}},
                            Date{std::numeric_limits<double>::infinity()}};
  for (const Value& row : refusals) EXPECT_FALSE(writeBinaryPropertyList(row).ok()) << row.description();
}

TEST(BinaryPropertyList, RoundTrip) {
  orvanta::test::RandomValues values(6);
  values.withNulls = false;
  for (int i = 0; i < 300; ++i) {
    const Value value = values.next();
    const Result<Bytes> written = writeBinaryPropertyList(value);
    ASSERT_TRUE(written.ok()) << written.error();
    const Result<Value> parsed = parseBinaryPropertyList(*written);
    ASSERT_TRUE(parsed.ok()) << parsed.error();
    EXPECT_EQ(*parsed, value);
  }
}

// More than 255 objects, and more than 65,535 bytes, take wider references and offsets.
TEST(BinaryPropertyList, WidensReferencesAndOffsets) {
  for (const std::size_t count : {200U, 300U, 70'000U}) {
    Array array;
    for (std::size_t i = 0; i < count; ++i) array.emplace_back(i);
    const Result<Bytes> written = writeBinaryPropertyList(array);
    ASSERT_TRUE(written.ok());
    EXPECT_EQ((*written)[written->size() - 25], count < 256 ? 1 : count < 65536 ? 2 : 4);
    EXPECT_EQ(*parseBinaryPropertyList(*written), Value(array));
  }
}

}  // namespace
}  // namespace platform
