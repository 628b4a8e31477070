#include "platform/PropertyList.h"

#include <gtest/gtest.h>

#include <sys/stat.h>

#include "tests/support/Bytes.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

using orvanta::test::bytesOf;
using orvanta::test::toHex;

TEST(PropertyList, ChoosesTheFormByTheFirstBytes) {
  const Value value = Dictionary{{"a", 1}};
  const Result<std::string> xml = writeXmlPropertyList(value);
  const Result<std::vector<std::uint8_t>> binary = writeBinaryPropertyList(value);
  EXPECT_EQ(*parsePropertyList(bytesOf(*xml)), value);
  EXPECT_EQ(*parsePropertyList(*binary), value);
  const std::pair<std::string_view, const char*> refusals[] = {
      {"", "empty"},
      {"bplist15 and so on, long enough for a trailer of 32 bytes", "not a \"bplist00\" at byte 0"},
      {"bplist0", "too short"},
      {"{ a = 1; }", "outside the root"},
      {R"({"a": 1})", "outside the root"},
      {"<html><body/></html>", "\"html\""},
      {"\xff\xfe<\0p\0", "no UTF-8"},
  };
  for (const auto& [text, expected] : refusals) {
    const Result<Value> parsed = parsePropertyList(bytesOf(text));
    ASSERT_FALSE(parsed.ok()) << text;
    EXPECT_NE(parsed.error().find(expected), std::string::npos) << text << ": " << parsed.error();
  }
}

TEST(PropertyList, ReadsFilesAndNamesThemInErrors) {
  const orvanta::test::TemporaryDirectory directory;
  const std::string good = directory.write("good.plist", *writeXmlPropertyList(Array{true}));
  EXPECT_EQ(*readPropertyListFile(good), Value(Array{true}));
  const std::string large = directory.write("large.plist", std::string(1001, ' '));
  const std::string fifo = directory / "fifo";
  ASSERT_EQ(::mkfifo(fifo.c_str(), 0600), 0);
  const std::pair<std::string, const char*> refusals[] = {
      {directory / "missing.plist", "No such file"},
      {directory.path(), "no regular file"},
      {fifo, "no regular file"},
      {directory.write("empty.plist", ""), "empty"},
      {directory.write("bad.plist", "<plist>"), "byte"},
      {large, "more than 1000 bytes"},
  };
  for (const auto& [path, expected] : refusals) {
    const Result<Value> read = readPropertyListFile(path, {10, 10, 1000});
    ASSERT_FALSE(read.ok()) << path;
    EXPECT_EQ(read.error().find(path + ": "), 0U) << read.error();
    EXPECT_NE(read.error().find(expected), std::string::npos) << read.error();
  }
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
  std::vector<std::uint8_t> all(256);
  for (std::size_t i = 0; i < all.size(); ++i) all[i] = static_cast<std::uint8_t>(i * 167);
  EXPECT_EQ(decodeBase64(encodeBase64(all)), all);
}

TEST(Base64, SkipsWhatIsOutsideTheAlphabet) {
  for (const char* text : {" Zm\n9v ", "Z-m_9.v", "Zm9v\xff", "Zm9v=", "Z,m,9,v", "\tZm9v=\n="}) {
    const auto decoded = decodeBase64(text);
    ASSERT_TRUE(decoded) << text;
    EXPECT_EQ(toHex(*decoded), toHex(bytesOf("foo"))) << text;
  }
  EXPECT_EQ(decodeBase64("Zm8"), decodeBase64("Zm8="));
  EXPECT_EQ(decodeBase64("/7=="), decodeBase64("/w=="));
  EXPECT_EQ(decodeBase64("!?"), std::vector<std::uint8_t>{});
  for (const char* text : {"Z", "Zm9vY", "Z===", "Zg==Zg==", "=Zm9v", "Zm=9v"})
    EXPECT_FALSE(decodeBase64(text)) << text;
}

}  // namespace
}  // namespace platform
