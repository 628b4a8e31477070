#include "backends/dashboard/DashboardDatagram.h"

#include <gtest/gtest.h>

#include <limits>
#include <string>

#include "platform/core/Text.h"
#include "platform/host/Digest.h"

namespace orvanta {
namespace {

std::string textOf(const std::vector<std::uint8_t>& datagram) {
  return {datagram.begin() + kDashboardHeaderBytes, datagram.end()};
}

std::vector<std::uint8_t> datagramOf(const Dictionary& payload) {
  return encodeDashboardDatagram({}, {.payload = std::make_shared<const Dictionary>(payload)});
}

TEST(DashboardDatagram, EveryByteOfTheHeader) {
  const std::string deviceID = "0123456789abcdef0123456789abcdef01234567";
  const auto payload = std::make_shared<const Dictionary>(Dictionary{{"b", "xyz"}, {"a", "q"}});
  constexpr auto kNone = EventFlag::none;
  const struct {
    const char* what;
    DashboardSender sender;
    Event event;         // its payload comes below
    std::string header;  // in hexadecimal: before the device identifier, that, behind it
    const char* line;
  } rows[] = {
      {"all fields",
       {8, 7, 1, 0, deviceID, 1},
       {nullptr, {123, 4999}, 0x0102, 0x0304, kNone, 0x0506},
       "080701010000007bfffffffeffffffb501020304"
       "30313233343536373839616263646566303132333435363738396162636465663031323334353637"
       "05060001",
       "123.004 0123456789abcdef0123456789abcdef01234567 127.0.0.1 XF     0     1  1286   258   772  a=q b=xyz"},
      {"short device, explicit server, latest time",
       {255, 14, 0xffffffff, 0xffff, "D", 3},
       {nullptr, {-1, 999'999}, 65535, 0, kNone, 0},
       "ff0e01f9ffffffff000000000000ffb5ffff000044" + std::string(78, '0') + "00000003",
       "4294967295.996 D 127.0.0.1 QB-ZIRL 65535 4294967295     0 65535     0  a=q b=xyz"},
      {"no such client type",
       {0, 256 + 19, 0, 0, "", 0},
       {nullptr, {0, 3999}, 0, 0, kNone, 9},
       "0013010000000000ffffffffffffffb500000000" + std::string(80, '0') + "00090000",
       "0.000  127.0.0.1      0     0     9     0     0  a=q b=xyz"},
  };
  for (const auto& row : rows) {
    Event event = row.event;
    event.payload = payload;
    const auto datagram = encodeDashboardDatagram(row.sender, event);
    EXPECT_EQ(platform::hexText(std::span(datagram).first(kDashboardHeaderBytes)), row.header) << row.what;
    EXPECT_EQ(textOf(datagram), " a=q b=xyz") << row.what;
    EXPECT_EQ(writeLocalLog(datagram), row.line) << row.what;

    const auto decoded = decodeDashboardDatagram(datagram);
    ASSERT_TRUE(decoded) << decoded.error();
    EXPECT_EQ(decoded->header.sessionID(), row.sender.sessionID);
    EXPECT_EQ(decoded->header.deviceIDText(), row.sender.deviceID);
    EXPECT_EQ(decoded->header.eventNumber, row.event.number);
  }
  const std::string longer = deviceID + "89";
  DashboardSender longDevice;
  longDevice.deviceID = longer;
  const auto bare = encodeDashboardDatagram(longDevice, {});
  EXPECT_EQ(bare.size(), 64U);
  const auto decoded = decodeDashboardDatagram(bare);
  EXPECT_EQ(decoded->header.lengthComplement, 0xffbf);
  EXPECT_EQ(decoded->header.deviceIDText(), deviceID);
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
  const std::string many(1019, 'x');
  const std::pair<Dictionary, std::string> rows[] = {
      {{{"k", many + "x"}}, " k=" + many + "x"},  // it just fits
      {{{"k", std::string(5000, 'x')}, {"a", 1}}, " a=1 k=" + std::string(1016, 'x')},
      {{{"k", many + "="}}, " k=" + many + "\\"},
      {{{std::string(2000, 'k'), "v"}}, " " + std::string(1022, 'k')},
      {{{"k", many + "é"}}, " k=" + many + "\xC3"},
  };
  for (const auto& [payload, text] : rows) {
    const auto datagram = datagramOf(payload);
    EXPECT_EQ(textOf(datagram), text);
    EXPECT_EQ(datagram.size(), 1087U);
    EXPECT_EQ(decodeDashboardDatagram(datagram)->header.length(), 1087U);
    EXPECT_EQ(writeLocalLog(datagram).has_value(), text.back() != '\xC3') << "half a character is not text";
  }
  Dictionary numbered;
  std::string expected;
  for (int i = 1000; i < 3000; ++i) numbered.set("k" + std::to_string(i), i < 2000 ? "12" : "1");
  for (int i = 2000; i < 3000; ++i) expected += " k" + std::to_string(i) + "=1";
  EXPECT_EQ(textOf(datagramOf(numbered)), expected.substr(0, 1023));
}

TEST(DashboardDatagram, RefusesOtherBytes) {
  using Bytes = std::vector<std::uint8_t>;
  const auto good = datagramOf({{"a", 1}});
  Bytes longer = good, marked = good;
  longer.push_back('x');
  marked[2] = 2;
  const std::pair<Bytes, std::string> rows[] = {
      {{}, "the datagram has 0 bytes, its header alone takes 64"},
      {{good.begin(), good.begin() + 63}, "the datagram has 63 bytes, its header alone takes 64"},
      {{good.begin(), good.end() - 1}, "the datagram has 67 bytes, its header says 68"},
      {longer, "the datagram has 69 bytes, its header says 68"},
      {marked, "the marker is 2 instead of 1"}};
  for (const auto& [bytes, error] : rows) {
    const auto decoded = decodeDashboardDatagram(bytes);
    EXPECT_EQ(decoded ? "decoded" : decoded.error(), error);
  }
}

TEST(DashboardDatagram, ParsesWhatItWrites) {
  using Pairs = std::vector<std::pair<std::string, std::string>>;
  const Dictionary payload{{"a", "x = y\\"}, {"b", "two words here"}, {"c", ""}, {"d", "="}};
  EXPECT_EQ(parseDashboardText(textOf(datagramOf(payload))),
            (Pairs{{"c", "empty"}, {"d", "="}, {"a", "x = y\\"}, {"b", "two words here"}}));
  EXPECT_TRUE(parseDashboardText("").empty());
  EXPECT_TRUE(parseDashboardText(" nothing here").empty());
  EXPECT_EQ(parseDashboardText(" a=\\"), (Pairs{{"a", "\\"}}));
}

}  // namespace
}  // namespace orvanta
