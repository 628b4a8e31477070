#include <cmath>
#include <limits>

#include "platform/codec/PropertyList.h"
#include "tests/platform/codec/CodecRows.h"
#include "tests/support/Bytes.h"

namespace orvanta::platform {
namespace {

using namespace orvanta::test;

constexpr double kInfinity = std::numeric_limits<double>::infinity();

Result<Value> parse(std::string_view text, const PropertyListLimits& limits = {}) {
  return parseXmlPropertyList(bytesOf(text), limits);
}

std::string plist(std::string_view content) {
  return "<plist>" + std::string(content) + "</plist>";
}

Result<Value> parseInPlist(std::string_view content) {
  return parse(plist(content));
}

TEST(XmlPropertyList, ReadsEveryElement) {
  const ReadRows<std::string> rows = {
      {"a\nb\nc\r", {"<string>a\r\nb\rc&#13;</string>"}},
      {"<>&'\"é𝄞&lt;", {"<string>&lt;&gt;&amp;&apos;&quot;&#233;&#x1d11E;&amp;lt;</string>"}},
      {"a <b> &amp; ce", {"<string>a<![CDATA[ <b> &amp; ]]>c<!-- d -->e<?f?></string>"}},
      {12, {"<integer> +12 </integer>", "<integer>1<!-- -->2</integer>"}},
      {-255, {"<integer>-0xff</integer>"}},
      {std::numeric_limits<std::int64_t>::min(), {"<integer>-9223372036854775808</integer>"}},
      {std::uint64_t{18446744073709551615U}, {"<integer>18446744073709551615</integer>"}},
      {-0.001, {"<real>-1e-3</real>"}},
      {kInfinity, {"<real>inf</real>", "<real>+Infinity</real>"}},
      {false, {"<false></false>"}},
      {Date{1709251199}, {"<date>2024-02-29T23:59:59Z</date>"}},
      {Data{{'f', 'o', 'o'}}, {"<data> Z\nm9v </data>"}},
      {Array{true, Array{}}, {"<array><!-- none --> <true/> <array/></array>"}},
      {Dictionary{{"", "x"}, {"b", true}}, {"<dict><key>b</key><true/><key/> <string>x</string></dict>"}},
  };
  expectValues(parseInPlist, rows);
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
  const RefusedRows<std::string> documents = {
      {"no root element", {"", "   "}},
      {"not \"plist\" but \"dict\" at byte 1", {"<dict/>"}},
      {"outside the root element at byte 0", {"text" + plist("<true/>")}},
      {"second root element at byte 23", {plist("<true/>") + "<plist/>"}},
      {"at byte",
       {"<plist><true/>", "<plist><array></dict></plist>", "<plist><array", plist("<string>") + std::string(1, '\0')}},
      // So no entity is expanded, once or a thousandfold.
      {"not predefined",
       {"<!DOCTYPE plist [<!ENTITY e \"x\">]>" + plist("<string>&e;</string>"),
        "<!DOCTYPE plist [<!ENTITY a \"x\"><!ENTITY e \"&a;&a;\">]>" + plist("<string>&e;</string>"),
        "<!DOCTYPE plist [<!ENTITY e SYSTEM \"file:///etc/passwd\">]>" + plist("<string>&e;</string>")}},
      {"encoding other than UTF-8",
       {"<?xml version='1.0' encoding='ISO-8859-1'?>" + plist("<string>\xc3\xa9</string>")}},
  };
  expectRefusals([](const std::string& text) { return parse(text); }, documents);
  const RefusedRows<std::string> contents = {
      {"without a value at byte 1", {""}},
      {"second value in \"plist\" at byte 15", {"<true/><false/>"}},
      {"text between elements",
       {"text", "<![CDATA[ ]]><true/>", "<array><true/>,<true/></array>", "<dict><key>a</key>text<true/></dict>"}},
      {"unknown element \"bool\" at byte 8", {"<bool/>"}},
      {"long name at byte 8", {"<" + std::string(1000, 'x') + "/>"}},
      {"\"key\" outside a \"dict\" at byte 8", {"<key>a</key>"}},
      {"without a value at byte 14", {"<dict><key>a</key></dict>", "<dict><key>a</key><key>b</key><true/></dict>"}},
      {"\"true\" without a \"key\" at byte 14", {"<dict><true/></dict>"}},
      {"same key twice at byte 8", {"<dict><key>a</key><true/><key>a</key><true/></dict>"}},
      {"an element inside \"key\"", {"<dict><key><b/></key><true/></dict>"}},
      {"content in \"true\"", {"<true>x</true>"}},
      {"holds no integer",
       {"<integer>1.5</integer>", "<integer>+-1</integer>", "<integer>0x</integer>", "<integer>0x-1</integer>",
        "<integer>18446744073709551616</integer>", "<integer>-9223372036854775809</integer>"}},
      {"holds no real number",
       {"<real></real>", "<real>1,5</real>", "<real>--1</real>", "<real>nan(1)</real>", "<real>1e999</real>"}},
      {"holds no date",
       {"<date>2023-02-29T00:00:00Z</date>", "<date>2023-01-01T24:00:00Z</date>", "<date>2023-01-01T00:00:00</date>",
        "<date>0000-01-01T00:00:00Z</date>", "<date>2023-1-1T00:00:00Z</date>"}},
      {"holds no base64", {"<data>Z</data>"}},
      {"not predefined",
       {"<string>&e;</string>", "<string>&amp</string>", "<string>&#0;</string>", "<string>&#xd800;</string>",
        "<string>&#-1;</string>", "<string>&#x110000;</string>"}},
      {"XML does not allow, at byte 15", {"<string>\x01</string>", "<string>\xef\xbf\xbf</string>"}},
      {"no UTF-8", {"<string>\xe9</string>"}},
  };
  expectRefusals(parseInPlist, contents);
}

TEST(XmlPropertyList, KeepsToTheLimits) {
  const auto nested = [](std::size_t depth) {
    std::string text = "<true/>";
    for (std::size_t i = 0; i < depth; ++i) {
      text = i % 2 == 0 ? "<array>" + text + "</array>" : "<dict><key/>" + text + "</dict>";
    }
    return plist(text);
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
            "<plist version=\"1.0\">\n<dict>\n"
            "\t<key>a&amp;b</key>\n\t<string>&lt;&#13;&gt;</string>\n"
            "\t<key>array</key>\n\t<array>\n"
            "\t\t<integer>1</integer>\n\t\t<integer>18446744073709551615</integer>\n"
            "\t\t<real>1.5</real>\n\t\t<real>-infinity</real>\n"
            "\t\t<true/>\n\t\t<false/>\n\t\t<array/>\n\t\t<dict/>\n\t</array>\n"
            "\t<key>data</key>\n\t<data>Zm9v</data>\n"
            "\t<key>date</key>\n\t<date>2024-02-29T23:59:59Z</date>\n"
            "</dict>\n</plist>\n");
}

TEST(XmlPropertyList, WritesNothingThatItCouldNotRead) {
  const Value rows[] = {Value(),         Array{nullptr}, std::string("a\x01"), "\xff",        Dictionary{{"\x02", 1}},
                        Date{kInfinity}, Date{-1e12},    Date{253402300800},   "\xef\xbf\xbe"};
  for (const Value& row : rows) EXPECT_FALSE(writeXmlPropertyList(row).ok()) << row.description();
}

TEST(XmlPropertyList, RoundTrip) {
  expectRoundTrips(5, writeXmlPropertyList, [](const std::string& text) { return parse(text); });
}

}  // namespace
}  // namespace orvanta::platform
