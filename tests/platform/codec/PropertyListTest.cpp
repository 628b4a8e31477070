#include "platform/codec/PropertyList.h"

#include <sys/stat.h>

#include "tests/platform/codec/CodecRows.h"
#include "tests/support/Bytes.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::platform {
namespace {

using namespace orvanta::test;

TEST(PropertyList, ChoosesTheFormByTheFirstBytes) {
  const Value value = Dictionary{{"a", 1}};
  EXPECT_EQ(*parsePropertyList(bytesOf(*writeXmlPropertyList(value))), value);
  EXPECT_EQ(*parsePropertyList(*writeBinaryPropertyList(value)), value);
  const RefusedRows<std::string_view> refusals = {
      {"empty", {""}},
      {"not a \"bplist00\" at byte 0", {"bplist15 and so on, long enough for a trailer of 32 bytes"}},
      {"too short", {"bplist0"}},
      {"outside the root", {"{ a = 1; }", R"({"a": 1})"}},
      {"\"html\"", {"<html><body/></html>"}},
      {"no UTF-8", {"\xff\xfe<\0p\0"}},
  };
  expectRefusals([](std::string_view text) { return parsePropertyList(bytesOf(text)); }, refusals);
}

TEST(PropertyList, ReadsFilesAndNamesThemInErrors) {
  const TemporaryDirectory directory;
  const std::string good = directory.write("good.plist", *writeXmlPropertyList(Array{true}));
  EXPECT_EQ(*readPropertyListFile(good), Value(Array{true}));
  const std::string fifo = directory / "fifo";
  ASSERT_EQ(::mkfifo(fifo.c_str(), 0600), 0);
  const RefusedRows<std::string> refusals = {
      {"missing.plist: No such file", {directory / "missing.plist"}},
      {"no regular file", {directory.path(), fifo}},
      {"empty.plist: ", {directory.write("empty.plist", "")}},
      {"bad.plist: ", {directory.write("bad.plist", "<plist>")}},
      {"more than 1000 bytes", {directory.write("large.plist", std::string(1001, ' '))}},
  };
  expectRefusals([](const std::string& path) { return readPropertyListFile(path, {10, 10, 1000}); }, refusals);
}

TEST(Base64, EncodesAndDecodes) {
  const std::pair<std::string_view, const char*> rows[] = {
      {"", ""}, {"f", "Zg=="}, {"fo", "Zm8="}, {"foo", "Zm9v"}, {"foob", "Zm9vYg=="}, {"\xff\xef\xbe", "/+++"}};
  for (const auto& [bytes, text] : rows) {
    EXPECT_EQ(encodeBase64(bytesOf(bytes)), text);
    const auto decoded = decodeBase64(text);
    ASSERT_TRUE(decoded) << text;
    EXPECT_EQ(toHex(*decoded), toHex(bytesOf(bytes)));
  }
}

TEST(Base64, SkipsWhatIsOutsideTheAlphabet) {
  for (const char* text : {" Zm\n9v ", "Z-m_9.v", "Zm9v\xff", "Zm9v=", "Z,m,9,v", "\tZm9v=\n="}) {
    const auto decoded = decodeBase64(text);
    ASSERT_TRUE(decoded) << text;
    EXPECT_EQ(toHex(*decoded), toHex(bytesOf("foo"))) << text;
  }
  EXPECT_EQ(decodeBase64("Zm8"), decodeBase64("Zm8="));
  EXPECT_EQ(decodeBase64("!?"), std::vector<std::uint8_t>{});
  for (const char* text : {"Z", "Zm9vY", "Z===", "Zg==Zg==", "=Zm9v", "Zm=9v"})
    EXPECT_FALSE(decodeBase64(text)) << text;
}

}  // namespace
}  // namespace orvanta::platform
