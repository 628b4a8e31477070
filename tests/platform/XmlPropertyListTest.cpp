#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "platform/PropertyList.h"
#include "tests/platform/RandomValue.h"
#include "tests/support/Bytes.h"

namespace platform {
namespace {

using orvanta::test::bytesOf;

constexpr double kInfinity = std::numeric_limits<double>::infinity();

Result<Value> parse(std::string_view text, const PropertyListLimits& limits = {}) {
  return parseXmlPropertyList(bytesOf(text), limits);
}

std::string plist(std::string_view content) {
  return "<plist>" + std::string(content) + "</plist>";
}

TEST(XmlPropertyList, ReadsEveryElement) {
  const std::pair<const char*, Value> rows[] = {
      {"<string>text</string>", "text"},
      {"<string/>", ""},
      {"<string> \n </string>", " \n "},
      {"<string>a\r\nb\rc&#13;</string>", "a\nb\nc\r"},
      {"<string>&lt;&gt;&amp;&apos;&quot;&#233;&#x1d11E;&amp;lt;</string>", "<>&'\"é𝄞&lt;"},
      {"<string>a<![CDATA[ <b> &amp; ]]>c<!-- d -->e<?f?></string>", "a <b> &amp; ce"},
      {"<integer>0</integer>", 0},
      {"<integer> +12 </integer>", 12},
      {"<integer>-9223372036854775808</integer>", std::numeric_limits<std::int64_t>::min()},
      {"<integer>18446744073709551615</integer>", std::uint64_t{18446744073709551615U}},
      {"<integer>0x1F</integer>", 31},
      {"<integer>-0xff</integer>", -255},
      {"<integer>1<!-- -->2</integer>", 12},
      {"<real>1.5</real>", 1.5},
      {"<real>-1e-3</real>", -0.001},
      {"<real>+.5</real>", 0.5},
      {"<real>inf</real>", kInfinity},
      {"<real>-Infinity</real>", -kInfinity},
      {"<true/>", true},
      {"<false></false>", false},
      {"<date>2024-02-29T23:59:59Z</date>", Date{1709251199}},
      {"<date>0001-01-01T00:00:00Z</date>", Date{-62135596800}},
      {"<data> Z\nm9v </data>", Data{{'f', 'o', 'o'}}},
      {"<data/>", Data{}},
      {"<array/>", Array{}},
      {"<dict> </dict>", Dictionary{}},
      {"<array><!-- none --> <true/> <array/></array>", Array{true, Array{}}},
      {"<dict><key>b</key><true/><key/> <string>x</string></dict>", Dictionary{{"", "x"}, {"b", true}}},
  };
  for (const auto& [text, expected] : rows) {
    const Result<Value> parsed = parse(plist(text));
    ASSERT_TRUE(parsed.ok()) << text << ": " << parsed.error();
    EXPECT_EQ(*parsed, expected) << text;
  }
  EXPECT_TRUE(std::isnan(std::get<double>(parse(plist("<real>NaN</real>"))->storage())));
}

TEST(XmlPropertyList, TakesDeclarationsDoctypeAndByteOrderMark) {
  for (const char* head :
       {"", "\xef\xbb\xbf", "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n", "<?xml version='1.0' encoding='us-ascii'?>",
        "<!-- first --> <?pi?> ", "<!DOCTYPE plist PUBLIC \"-//X//DTD PLIST 1.0//EN\" \"http://example.com/x.dtd\">",
        "<!DOCTYPE plist [<!ENTITY e \"<string>x</string>\"><!ELEMENT plist ANY>]>"}) {
    const Result<Value> parsed = parse(head + plist(" <true/>\n") + "\n<!-- last -->");
    ASSERT_TRUE(parsed.ok()) << head << ": " << parsed.error();
    EXPECT_EQ(*parsed, Value(true));
  }
}

TEST(XmlPropertyList, RefusesWithThePlace) {
  const std::pair<std::string, const char*> rows[] = {
      {"", "no root element"},
      {"   ", "no root element"},
      {"<dict/>", "not \"plist\" but \"dict\" at byte 1"},
      {"text" + plist("<true/>"), "outside the root element at byte 0"},
      {plist("<true/>") + "<plist/>", "second root element at byte 23"},
      {plist(""), "without a value at byte 1"},
      {plist("<true/><false/>"), "second value in \"plist\" at byte 15"},
      {plist("<true/>text"), "text between elements at byte 14"},
      {plist("text"), "text between elements at byte 7"},
      {plist("<![CDATA[ ]]><true/>"), "text between elements"},
      {"<plist><true/>", "at byte"},
      {"<plist><array></dict></plist>", "at byte"},
      {"<plist><array", "at byte"},
      {plist("<bool/>"), "unknown element \"bool\" at byte 8"},
      {plist("<" + std::string(1000, 'x') + "/>"), "long name at byte 8"},
      {plist("<key>a</key>"), "\"key\" outside a \"dict\" at byte 8"},
      {plist("<array><true/>,<true/></array>"), "text between elements at byte 21"},
      {plist("<dict><key>a</key></dict>"), "without a value at byte 14"},
      {plist("<dict><key>a</key><key>b</key><true/></dict>"), "without a value at byte 14"},
      {plist("<dict><true/></dict>"), "\"true\" without a \"key\" at byte 14"},
      {plist("<dict><key>a</key>text<true/></dict>"), "text between elements at byte 25"},
      {plist("<dict><key>a</key><true/><key>a</key><true/></dict>"), "same key twice at byte 8"},
      {plist("<dict><key><b/></key><true/></dict>"), "an element inside \"key\""},
      {plist("<string>a<b/></string>"), "an element inside \"string\" at byte 17"},
      {plist("<true>x</true>"), "content in \"true\""},
      {plist("<integer/>"), "holds no integer at byte 8"},
      {plist("<integer>1.5</integer>"), "holds no integer"},
      {plist("<integer>+-1</integer>"), "holds no integer"},
      {plist("<integer>0x</integer>"), "holds no integer"},
      {plist("<integer>0x-1</integer>"), "holds no integer"},
      {plist("<integer>18446744073709551616</integer>"), "holds no integer"},
      {plist("<integer>-9223372036854775809</integer>"), "holds no integer"},
      {plist("<real></real>"), "holds no real number"},
      {plist("<real>1,5</real>"), "holds no real number"},
      {plist("<real>--1</real>"), "holds no real number"},
      {plist("<real>nan(1)</real>"), "holds no real number"},
      {plist("<real>1e999</real>"), "holds no real number"},
      {plist("<date>2023-02-29T00:00:00Z</date>"), "holds no date"},
      {plist("<date>2023-01-01T24:00:00Z</date>"), "holds no date"},
      {plist("<date>2023-01-01T00:00:00</date>"), "holds no date"},
      {plist("<date>0000-01-01T00:00:00Z</date>"), "holds no date"},
      {plist("<date>2023-1-1T00:00:00Z</date>"), "holds no date"},
      {plist("<data>Z</data>"), "holds no base64"},
      {plist("<string>&e;</string>"), "not predefined"},
      {"<!DOCTYPE plist [<!ENTITY e \"x\">]>" + plist("<string>&e;</string>"), "not predefined"},
      {plist("<string>&amp</string>"), "not predefined"},
      {plist("<string>&#0;</string>"), "not predefined"},
      {plist("<string>&#xd800;</string>"), "not predefined"},
      {plist("<string>&#-1;</string>"), "not predefined"},
      {plist("<string>&#x110000;</string>"), "not predefined"},
      {plist("<string>\x01</string>"), "XML does not allow, at byte 15"},
      {plist("<string>\xef\xbf\xbf</string>"), "XML does not allow, at byte 15"},
      {plist("<string>\xe9</string>"), "no UTF-8"},
      {plist("<string>") + std::string(1, '\0'), "at byte"},
      {"<?xml version='1.0' encoding='ISO-8859-1'?>" + plist("<string>\xc3\xa9</string>"), "encoding other than UTF-8"},
  };
  for (const auto& [text, expected] : rows) {
    const Result<Value> parsed = parse(text);
    ASSERT_FALSE(parsed.ok()) << text;
    EXPECT_NE(parsed.error().find(expected), std::string::npos) << text << ": " << parsed.error();
  }
}

// Entities that would grow a thousandfold are refused like any other, and quickly.
TEST(XmlPropertyList, ExpandsNoEntities) {
  std::string text = "<!DOCTYPE plist [<!ENTITY a0 \"aaaaaaaaaa\">";
  for (int i = 1; i < 20; ++i) {
    text += "<!ENTITY a" + std::to_string(i) + " \"";
    for (int j = 0; j < 10; ++j) text += "&a" + std::to_string(i - 1) + ";";
    text += "\">";
  }
  EXPECT_FALSE(parse(text + "]>" + plist("<string>&a19;</string>")).ok());
  EXPECT_FALSE(
      parse("<!DOCTYPE plist [<!ENTITY f SYSTEM \"file:///etc/passwd\">]>" + plist("<string>&f;</string>")).ok());
}

TEST(XmlPropertyList, KeepsToTheLimits) {
  const auto nested = [](std::size_t depth) {
    std::string opening, closing;
    for (std::size_t i = 0; i < depth; ++i) {
      const bool isArray = (depth - i) % 2 == 1;
      opening += isArray ? "<array>" : "<dict><key/>";
    }
    // The innermost is an array and closes first.
    for (std::size_t i = 0; i < depth; ++i) closing += i % 2 == 0 ? "</array>" : "</dict>";
    return plist(opening + "<true/>" + closing);
  };
  const PropertyListLimits limits{6, 20, 400};
  EXPECT_TRUE(parse(nested(6), limits).ok());
  EXPECT_NE(parse(nested(7), limits).error().find("deeper than 6"), std::string::npos);
  EXPECT_FALSE(parse(nested(20'000)).ok());

  const auto elements = [](std::size_t count) {
    std::string text;
    for (std::size_t i = 0; i < count; ++i) text += "<true/>";
    return plist("<array>" + text + "</array>");
  };
  EXPECT_TRUE(parse(elements(19), limits).ok());
  EXPECT_NE(parse(elements(20), limits).error().find("more than 20 values"), std::string::npos);
  EXPECT_NE(parse(plist("<string>" + std::string(400, 'x') + "</string>"), limits).error().find("more than 400 bytes"),
            std::string::npos);
}

TEST(XmlPropertyList, Writes) {
  const Result<std::string> written = writeXmlPropertyList(Dictionary{
      {"array", Array{1, std::uint64_t{18446744073709551615U}, 1.5, -kInfinity, true, false, Array{}, Dictionary{}}},
      {"a&b", "<\r>"},
      {"data", Data{{'f', 'o', 'o'}}},
      {"date", Date{1709251199.75}},
  });
  ASSERT_TRUE(written.ok()) << written.error();
  EXPECT_EQ(*written,
            "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
            "<plist version=\"1.0\">\n"
            "<dict>\n"
            "\t<key>a&amp;b</key>\n"
            "\t<string>&lt;&#13;&gt;</string>\n"
            "\t<key>array</key>\n"
            "\t<array>\n"
            "\t\t<integer>1</integer>\n"
            "\t\t<integer>18446744073709551615</integer>\n"
            "\t\t<real>1.5</real>\n"
            "\t\t<real>-infinity</real>\n"
            "\t\t<true/>\n"
            "\t\t<false/>\n"
            "\t\t<array/>\n"
            "\t\t<dict/>\n"
            "\t</array>\n"
            "\t<key>data</key>\n"
            "\t<data>Zm9v</data>\n"
            "\t<key>date</key>\n"
            "\t<date>2024-02-29T23:59:59Z</date>\n"
            "</dict>\n"
            "</plist>\n");
}

TEST(XmlPropertyList, WritesNothingThatItCouldNotRead) {
  const Value rows[] = {Value(),         Array{nullptr}, std::string("a\x01"), "\xff",        Dictionary{{"\x02", 1}},
                        Date{kInfinity}, Date{-1e12},    Date{253402300800},   "\xef\xbf\xbe"};
  for (const Value& row : rows) EXPECT_FALSE(writeXmlPropertyList(row).ok()) << row.description();
}

TEST(XmlPropertyList, RoundTrip) {
  orvanta::test::RandomValues values(5);
  values.withNulls = false;
  for (int i = 0; i < 300; ++i) {
    const Value value = values.next();
    const Result<std::string> written = writeXmlPropertyList(value);
    ASSERT_TRUE(written.ok()) << written.error();
    const Result<Value> parsed = parse(*written);
    ASSERT_TRUE(parsed.ok()) << parsed.error();
    EXPECT_EQ(*parsed, value);
  }
}

}  // namespace
}  // namespace platform
