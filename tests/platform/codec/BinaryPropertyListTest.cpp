#include <limits>

#include "platform/codec/PropertyList.h"
#include "tests/platform/codec/CodecRows.h"
#include "tests/support/Bytes.h"

namespace orvanta::platform {
namespace {

using namespace orvanta::test;
using Bytes = std::vector<std::uint8_t>;
using Objects = std::vector<std::string>;

// A document of these objects, the first one on top, with offsets and references of one byte.
Bytes document(const Objects& objects) {
  Bytes bytes = fromHex("'bplist00'");
  Bytes end;
  for (const std::string& object : objects) {
    end.push_back(static_cast<std::uint8_t>(bytes.size()));
    const Bytes content = fromHex(object);
    bytes.insert(bytes.end(), content.begin(), content.end());
  }
  end.insert(end.end(), {0, 0, 0, 0, 0, 0, 1, 1});
  for (const std::size_t field : {objects.size(), std::size_t{0}, bytes.size()}) {
    end.insert(end.end(), 7, 0);
    end.push_back(static_cast<std::uint8_t>(field));
  }
  bytes.insert(bytes.end(), end.begin(), end.end());
  return bytes;
}

Result<Value> parse(const Objects& objects) {
  return parseBinaryPropertyList(document(objects));
}

TEST(BinaryPropertyList, WritesTheShortestFormAndReadsIt) {
  const std::pair<Value, Objects> rows[] = {
      {false, {"08"}},
      {255, {"10 ff"}},
      {256, {"11 01 00"}},
      {std::int64_t{1} << 32, {"13 00 00 00 01 00 00 00 00"}},
      {-2, {"13 ff ff ff ff ff ff ff fe"}},
      {std::uint64_t{1} << 63U, {"14 00 00 00 00 00 00 00 00 80 00 00 00 00 00 00 00"}},
      {-1.5, {"23 bf f8 00 00 00 00 00 00"}},
      {Date{978307200}, {"33 00 00 00 00 00 00 00 00"}},
      {Data{Bytes(15, 7)}, {"4f 10 0f 07 07 07 07 07 07 07 07 07 07 07 07 07 07 07"}},
      {"abc", {"53 'abc'"}},
      {"é€𝄞", {"64 00 e9 20 ac d8 34 dd 1e"}},
      {Array{"a", Dictionary{{"a", "a"}}}, {"a2 01 02", "51 'a'", "d1 01 01"}},
  };
  for (const auto& [value, objects] : rows) {
    const Result<Bytes> written = writeBinaryPropertyList(value);
    ASSERT_TRUE(written.ok()) << written.error();
    EXPECT_EQ(toHex(*written), toHex(document(objects))) << value.description();
    EXPECT_EQ(*parse(objects), value);
  }
  const Value refusals[] = {Value(), Array{nullptr}, "\xff", Dictionary{{"\xff", 1}},
                            Date{std::numeric_limits<double>::infinity()}};
  for (const Value& row : refusals) EXPECT_FALSE(writeBinaryPropertyList(row).ok()) << row.description();
}

TEST(BinaryPropertyList, ReadsWhatOthersWrite) {
  const ReadRows<Objects> rows = {
      {Value(), {{"00"}}},
      {std::numeric_limits<std::int64_t>::min(), {{"14 ff ff ff ff ff ff ff ff 80 00 00 00 00 00 00 00"}}},
      {1.5, {{"22 3f c0 00 00"}}},
      {"abc", {{"5f 13 00 00 00 00 00 00 00 03 'abc'"}}},
      {Array{true}, {{"b1 01", "09"}, {"c1 01", "09"}}},
      {Dictionary{{"a", 2}, {"b", 1}}, {{"d2 01 02 03 04", "51 'b'", "51 'a'", "10 01", "10 02"}}},
      {Dictionary{{"é", Dictionary{}}}, {{"d1 01 02", "61 00 e9", "d0"}}},
  };
  expectValues(parse, rows);
}

TEST(BinaryPropertyList, RefusesObjectsWithThePlace) {
  const RefusedRows<Objects> rows = {
      {"unknown object type 0x0f at byte 8", {{"0f"}}},
      {"a UID", {{"80 01"}}},
      {"more than 16 bytes", {{"15 00000000000000000000000000000000 00000000000000000000000000000000"}}},
      {"more than 64 bits at byte 8", {{"14 00 00 00 00 00 00 00 01 00 00 00 00 00 00 00 00"}}},
      {"integer that ends too late", {{"11 00"}}},
      {"other than 4 or 8 bytes", {{"21 00 00"}}},
      {"real number that ends too late", {{"23 00"}}},
      {"date of other than 8 bytes", {{"32 00 00 00 00"}}},
      {"no finite number", {{"33 7f f0 00 00 00 00 00 00"}}},
      {"data that ends too late", {{"43 00 00"}, {"4f 13 ff ff ff ff ff ff ff ff"}}},
      {"count that is no integer", {{"4f 09"}, {"4f 14 00000000000000000000000000000000"}, {"4f 11 00"}, {"4f"}}},
      {"text that ends too late", {{"52 'a'"}, {"61 00"}, {"6f 13 80 00 00 00 00 00 00 01 00 41"}}},
      {"ASCII text with other bytes", {{"51 ff"}}},
      {"high surrogate without a low one at byte 9", {{"62 d8 34 00 41"}, {"61 d8 34"}}},
      {"low surrogate without a high one at byte 11", {{"62 00 41 dd 1e"}}},
      {"reference to object 5 of 1 at byte 9", {{"a1 05"}}},
      {"reference", {{"a2 01", "09"}}},
      {"references that end too late", {{"af 13 7f ff ff ff ff ff ff ff"}, {"d1 01"}}},
      {"key that is no text at byte 11", {{"d1 01 02", "10 01", "09"}}},
      {"same key twice at byte 8", {{"d2 01 02 03 03", "51 'a'", "51 'a'", "09"}, {"d2 01 01 02 02", "51 'a'", "09"}}},
      {"contains itself at byte 8", {{"a1 00"}, {"a1 01", "d1 02 00", "51 'a'"}}},
  };
  expectRefusals(parse, rows);
}

TEST(BinaryPropertyList, RefusesTrailersThatLie) {
  const Bytes good = document({"a1 01", "09"});
  ASSERT_TRUE(parseBinaryPropertyList(good).ok());
  const std::size_t trailer = good.size() - 32;
  const struct {
    std::size_t offset;
    const char* bytes;
    const char* expected;
  } rows[] = {
      {0, "'bplist01'", "not a \"bplist00\""},
      {trailer + 6, "00", "offset size"},
      {trailer + 6, "02", "offset table outside"},
      {trailer + 7, "00", "reference size"},
      {trailer + 8, "ff ff ff ff ff ff ff ff", "offset table outside"},
      {trailer + 8, "00 00 00 00 00 00 00 00", "top object"},
      {trailer + 24, "ff ff ff ff ff ff ff ff", "offset table outside"},
      {trailer - 1, "ff", "offset outside the objects"},
  };
  for (const auto& row : rows) {
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
  Objects arrays;
  for (std::uint8_t i = 1; i <= 20; ++i) arrays.push_back("aa" + toHex(Bytes(10, i)));
  arrays.emplace_back("09");
  EXPECT_NE(parse(arrays).error().find("more than 1000000 values"), std::string::npos);

  const Bytes shared = document({"a4 01 01 01 01", "5f 10 14 'twenty characters ok'"});
  EXPECT_TRUE(parseBinaryPropertyList(shared, {10, 5, 100}).ok());
  EXPECT_NE(parseBinaryPropertyList(shared, {10, 4, 100}).error().find("more than 4 values"), std::string::npos);
  EXPECT_NE(parseBinaryPropertyList(shared, {10, 5, 79}).error().find("more than 79 bytes"), std::string::npos);
  EXPECT_NE(parseBinaryPropertyList(document({"a1 01", "a1 02", "a0"}), {2, 10, 100}).error().find("deeper than 2"),
            std::string::npos);
}

TEST(BinaryPropertyList, RoundTrip) {
  expectRoundTrips(6, writeBinaryPropertyList, [](const Bytes& bytes) { return parseBinaryPropertyList(bytes); });
}

}  // namespace
}  // namespace orvanta::platform
