#include "backends/DashboardDatagram.h"

#include <gtest/gtest.h>

#include <limits>
#include <string>

#include "platform/Digest.h"

namespace orvanta {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

std::string textOf(const std::vector<std::uint8_t>& datagram) {
  return {datagram.begin() + kDashboardHeaderBytes, datagram.end()};
}

std::vector<std::uint8_t> datagramOf(const Dictionary& payload) {
  DashboardEvent event;
  event.payload = &payload;
  return encodeDashboardDatagram({}, event);
}

struct ByteRow {
  const char* what;
  DashboardSender sender;
  platform::TimeValue time;
  std::uint16_t method, respCode, eventNumber;
  const char* header;  // in hexadecimal
  const char* line;
};

TEST(DashboardDatagram, EveryByteOfTheHeader) {
  const std::string udid = "0123456789abcdef0123456789abcdef01234567";
  const std::string noDevice(80, '0');
  const Dictionary payload{{"b", "xyz"}, {"a", "q"}};
  const ByteRow rows[] = {
      {"all fields",
       {8, 7, 1, 0, udid, 1},
       {123, 4999},
       0x0102,
       0x0304,
       0x0506,
       "08070101"
       "0000007b"
       "fffffffe"
       "ffff"
       "ffb5"
       "0102"
       "0304"
       "30313233343536373839616263646566303132333435363738396162636465663031323334353637"
       "0506"
       "0001",
       "123.004 0123456789abcdef0123456789abcdef01234567 127.0.0.1 XF     0     1  1286   258   772  a=q b=xyz"},
      {"short device, explicit server, latest time",
       {255, 14, 0xffffffff, 0xffff, "D", 3},
       {-1, 999'999},
       65535,
       0,
       0,
       "ff0e01f9"
       "ffffffff"
       "00000000"
       "0000"
       "ffb5"
       "ffff"
       "0000"
       "44000000000000000000000000000000000000000000000000000000000000000000000000000000"
       "0000"
       "0003",
       "4294967295.996 D 127.0.0.1 QB-ZIRL 65535 4294967295     0 65535     0  a=q b=xyz"},
      {"no such client type",
       {0, 256 + 19, 0, 0, "", 0},
       {0, 3999},
       0,
       0,
       9,
       "00130100"
       "00000000"
       "ffffffff"
       "ffff"
       "ffb5"
       "0000"
       "0000"
       "00000000000000000000000000000000000000000000000000000000000000000000000000000000"
       "0009"
       "0000",
       "0.000  127.0.0.1      0     0     9     0     0  a=q b=xyz"},
  };
  for (const ByteRow& row : rows) {
    const auto datagram =
        encodeDashboardDatagram(row.sender, {&payload, row.time, row.method, row.respCode, row.eventNumber});
    EXPECT_EQ(platform::hexDigits(std::span(datagram).first(kDashboardHeaderBytes)), row.header) << row.what;
    EXPECT_EQ(textOf(datagram), " a=q b=xyz") << row.what;
    EXPECT_EQ(writeLocalLog(datagram), row.line) << row.what;

    const auto decoded = decodeDashboardDatagram(datagram);
    ASSERT_TRUE(decoded) << decoded.error();
    EXPECT_EQ(decoded->header.sessionID(), row.sender.sessionID);
    EXPECT_EQ(decoded->header.clientVersion(), row.sender.clientVersion);
    EXPECT_EQ(decoded->header.deviceIDText(), row.sender.deviceID);
    EXPECT_EQ(decoded->header.eventNumber, row.eventNumber);
    EXPECT_EQ(decoded->text, " a=q b=xyz");
  }
  const auto bare = encodeDashboardDatagram({}, {});
  EXPECT_EQ(bare.size(), 64U);
  EXPECT_EQ(decodeDashboardDatagram(bare)->header.lengthComplement, 0xffbf);
  DashboardSender longDevice;
  longDevice.deviceID = "0123456789abcdef0123456789abcdef0123456789";
  EXPECT_EQ(decodeDashboardDatagram(encodeDashboardDatagram(longDevice, {}))->header.deviceIDText(), udid);
}

TEST(DashboardDatagram, Text) {
  using namespace std::string_literals;
  const std::pair<Dictionary, std::string> rows[] = {
      {{}, ""},
      {{{"k", "x=y\nz"}}, " k=x\\=yz"},
      {{{"k", "\\=\n\\"}}, R"( k=\\\=\\)"},
      {{{"k", ""}}, " k=empty"},
      {{{"k", "\n\n"}}, " k=empty"},
      {{{"d", Dictionary{}}, {"a", Array{}}, {"t", platform::Date{}}, {"n", nullptr}, {"x", platform::Data{}}},
       " a=null d=null n=null t=null x=null"},
      {{{"t", true}, {"f", false}, {"i", -12}, {"u", 18446744073709551615ULL}},
       " f=0 t=1 i=-12 u=18446744073709551615"},
      {{{"a", 0.1}, {"b", 1.0}, {"c", 1e300}, {"d", std::numeric_limits<double>::infinity()}},
       " b=1 a=0.1 d=inf c=1e+300"},
      {{{"b", "2"}, {"a", "1"}, {"c", "3"}}, " a=1 b=2 c=3"},
      {{{"long", "12"}, {"k=e\\y", "3"}}, " k=e\\y=3 long=12"},
      // The length that counts is the description's, before anything is escaped or left out.
      {{{"a", "\n\n\n"}, {"b", "=="}}, R"( b=\=\= a=empty)"},
      {{{"", "v"}}, " =v"},
      {{{"a\0b"s, "c\0d"s}}, " a=c"},
  };
  for (const auto& [payload, text] : rows) EXPECT_EQ(textOf(datagramOf(payload)), text);
}

TEST(DashboardDatagram, CutsTheTextAt1023Bytes) {
  const auto full = datagramOf({{"k", std::string(1020, 'x')}});
  EXPECT_EQ(full.size(), 1087U);
  EXPECT_TRUE(writeLocalLog(full));
  const auto cut = datagramOf({{"k", std::string(5000, 'x')}, {"a", 1}});
  EXPECT_EQ(textOf(cut), " a=1 k=" + std::string(1016, 'x'));
  EXPECT_EQ(decodeDashboardDatagram(cut)->header.length(), 1087U);
  EXPECT_EQ(textOf(datagramOf({{"k", std::string(1019, 'x') + "="}})), " k=" + std::string(1019, 'x') + "\\");
  EXPECT_EQ(textOf(datagramOf({{std::string(2000, 'k'), "v"}})), " " + std::string(1022, 'k'));

  const auto inside = datagramOf({{"k", std::string(1019, 'x') + "é"}});
  EXPECT_EQ(inside.size(), 1087U);
  EXPECT_EQ(writeLocalLog(inside), std::nullopt);

  Dictionary many;
  std::string expected;
  for (int i = 1000; i < 3000; ++i) many.set("k" + std::to_string(i), i < 2000 ? "12" : "1");
  for (int i = 2000; i < 3000; ++i) expected += " k" + std::to_string(i) + "=1";
  EXPECT_EQ(textOf(datagramOf(many)), expected.substr(0, 1023));
}

TEST(DashboardDatagram, RefusesWhatIsNone) {
  const auto good = datagramOf({{"a", 1}});
  auto refusal = [](std::vector<std::uint8_t> bytes) {
    const auto decoded = decodeDashboardDatagram(bytes);
    return decoded ? std::string("decoded") : decoded.error();
  };
  EXPECT_EQ(refusal({}), "the datagram has 0 bytes, its header alone takes 64");
  EXPECT_EQ(refusal({good.begin(), good.begin() + 63}), "the datagram has 63 bytes, its header alone takes 64");
  EXPECT_EQ(refusal({good.begin(), good.end() - 1}), "the datagram has 67 bytes, its header says 68");
  auto longer = good;
  longer.push_back('x');
  EXPECT_EQ(refusal(longer), "the datagram has 69 bytes, its header says 68");
  auto marked = good;
  marked[2] = 2;
  EXPECT_EQ(refusal(marked), "the marker is 2 instead of 1");
}

TEST(DashboardDatagram, ParsesWhatItWrites) {
  const Dictionary payload{{"a", "x = y\\"}, {"b", "two words here"}, {"c", ""}, {"d", "="}};
  const std::vector<std::pair<std::string, std::string>> expected{
      {"d", "="}, {"a", "x = y\\"}, {"b", "two words here"}};
  auto pairs = parseDashboardText(textOf(datagramOf(payload)));
  ASSERT_EQ(pairs.size(), 4U);
  EXPECT_EQ(pairs[0], (std::pair<std::string, std::string>("c", "empty")));
  pairs.erase(pairs.begin());
  EXPECT_EQ(pairs, expected);
  EXPECT_TRUE(parseDashboardText("").empty());
  EXPECT_TRUE(parseDashboardText(" nothing here").empty());
  EXPECT_EQ(parseDashboardText(" a=\\").at(0).second, "\\");
}

}  // namespace
}  // namespace orvanta
