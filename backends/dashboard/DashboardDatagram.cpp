#include "backends/dashboard/DashboardDatagram.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstring>
#include <iterator>

#include "config/ClientTypes.h"
#include "platform/core/Utf8.h"

namespace orvanta {

namespace {

// Shorter than any pair that can stand in a text, " =x", but for the one key that may be empty.
constexpr std::size_t kMaximumPairs = kDashboardMaximumText / 3 + 1;

class HeaderWriter {
 public:
  explicit HeaderWriter(std::uint8_t* to) : _to(to) {}
  void u8(std::uint8_t v) { *_to++ = v; }
  void u16(std::uint16_t v) {
    u8(static_cast<std::uint8_t>(v >> 8U));
    u8(static_cast<std::uint8_t>(v));
  }
  void u32(std::uint32_t v) {
    u16(static_cast<std::uint16_t>(v >> 16U));
    u16(static_cast<std::uint16_t>(v));
  }
  void bytes(const std::array<char, 40>& v) { _to = std::copy(v.begin(), v.end(), _to); }

 private:
  std::uint8_t* _to;
};

class HeaderReader {
 public:
  explicit HeaderReader(const std::uint8_t* from) : _from(from) {}
  std::uint8_t u8() { return *_from++; }
  std::uint16_t u16() {
    const unsigned high = u8();
    return static_cast<std::uint16_t>(high << 8U | u8());
  }
  std::uint32_t u32() {
    const std::uint32_t high = u16();
    return high << 16U | u16();
  }
  void bytes(std::array<char, 40>& v) {
    std::copy(_from, _from + v.size(), v.begin());
    _from += v.size();
  }

 private:
  const std::uint8_t* _from;
};

void writeHeader(const DashboardHeader& header, std::uint8_t* to) {
  HeaderWriter writer(to);
  writer.u8(header.versionMajor);
  writer.u8(header.clientType);
  writer.u8(header.marker);
  writer.u8(header.timeQuarterMs);
  writer.u32(header.timeSeconds);
  writer.u32(header.sessionIDComplement);
  writer.u16(header.clientVersionComplement);
  writer.u16(header.lengthComplement);
  writer.u16(header.method);
  writer.u16(header.respCode);
  writer.bytes(header.deviceID);
  writer.u16(header.eventNumber);
  writer.u16(header.mode);
}

DashboardHeader readHeader(const std::uint8_t* from) {
  HeaderReader reader(from);
  DashboardHeader header;
  header.versionMajor = reader.u8();
  header.clientType = reader.u8();
  header.marker = reader.u8();
  header.timeQuarterMs = reader.u8();
  header.timeSeconds = reader.u32();
  header.sessionIDComplement = reader.u32();
  header.clientVersionComplement = reader.u16();
  header.lengthComplement = reader.u16();
  header.method = reader.u16();
  header.respCode = reader.u16();
  reader.bytes(header.deviceID);
  header.eventNumber = reader.u16();
  header.mode = reader.u16();
  return header;
}

// The text while it grows, cut where it would pass its maximum.
class TextArea {
 public:
  explicit TextArea(std::uint8_t* bytes) : _bytes(bytes) {}

  bool full() const { return _length == kDashboardMaximumText; }
  std::size_t length() const { return _length; }

  void append(char c) {
    if (!full()) _bytes[_length++] = static_cast<std::uint8_t>(c);
  }
  void append(std::string_view text) {
    text = text.substr(0, text.find('\0')).substr(0, kDashboardMaximumText - _length);
    std::memcpy(_bytes + _length, text.data(), text.size());
    _length += text.size();
  }
  // Appends a value without its line feeds, with its backslashes and "=" escaped.
  void sanitize(std::string_view text) {
    bool empty = true;
    for (const char c : text) {
      if (c == '\n') continue;
      empty = false;
      if (c == '\0' || full()) return;
      if (c == '\\' || c == '=') append('\\');
      append(c);
    }
    if (empty) append("empty");
  }

 private:
  std::uint8_t* _bytes;
  std::size_t _length = 0;
};

// A pair of the payload with the description of its value, which is the text itself or stands in the numbers' buffer.
struct Pair {
  const std::string* key;
  const char* text;  // null: at `offset` in the buffer of number texts
  std::size_t offset;
  std::size_t length;
};

Pair descriptionForObject(const Dictionary::Entry& entry, std::string& numbers) {
  constexpr std::string_view kNoDescription = "null";
  if (const std::string* text = entry.second.string()) return {&entry.first, text->data(), 0, text->size()};
  if (!entry.second.isNumber()) return {&entry.first, kNoDescription.data(), 0, kNoDescription.size()};
  const std::size_t offset = numbers.size();
  numbers += entry.second.description();
  return {&entry.first, nullptr, offset, numbers.size() - offset};
}

std::size_t writeText(const Dictionary& payload, std::uint8_t* to) {
  std::vector<Pair> pairs;
  pairs.reserve(payload.size());
  std::string numbers;
  for (const auto& entry : payload) pairs.push_back(descriptionForObject(entry, numbers));

  // Keys stand in the payload in their order, and so do their addresses.
  const auto shorter = [](const Pair& a, const Pair& b) {
    return a.length != b.length ? a.length < b.length : std::less<>()(a.key, b.key);
  };
  if (pairs.size() > kMaximumPairs) {
    std::nth_element(pairs.begin(), pairs.begin() + kMaximumPairs, pairs.end(), shorter);
    pairs.resize(kMaximumPairs);
  }
  std::sort(pairs.begin(), pairs.end(), shorter);

  TextArea text(to);
  for (const Pair& pair : pairs) {
    if (text.full()) break;
    text.append(' ');
    text.append(*pair.key);
    text.append('=');
    text.sanitize({pair.text != nullptr ? pair.text : numbers.data() + pair.offset, pair.length});
  }
  return text.length();
}

}  // namespace

std::string_view DashboardHeader::deviceIDText() const {
  const auto end = std::find(deviceID.begin(), deviceID.end(), '\0');
  return {deviceID.data(), static_cast<std::size_t>(end - deviceID.begin())};
}

std::vector<std::uint8_t> encodeDashboardDatagram(const DashboardSender& sender, const Event& event) {
  std::array<std::uint8_t, kDashboardHeaderBytes + kDashboardMaximumText> datagram;
  const std::size_t textLength =
      !event.payload ? 0 : writeText(*event.payload, datagram.data() + kDashboardHeaderBytes);
  const std::size_t length = kDashboardHeaderBytes + textLength;

  DashboardHeader header;
  header.versionMajor = sender.versionMajor;
  header.clientType = static_cast<std::uint8_t>(sender.clientType);
  header.timeQuarterMs = static_cast<std::uint8_t>(event.time.microseconds / 4000);
  header.timeSeconds = static_cast<std::uint32_t>(event.time.seconds);
  header.sessionIDComplement = ~sender.sessionID;
  header.clientVersionComplement = static_cast<std::uint16_t>(~sender.clientVersion);
  header.lengthComplement = static_cast<std::uint16_t>(~length);
  header.method = event.category;
  header.respCode = event.type;
  const std::string_view deviceID = sender.deviceID.substr(0, header.deviceID.size());
  std::copy(deviceID.begin(), deviceID.end(), header.deviceID.begin());
  header.eventNumber = event.number;
  header.mode = sender.mode;
  writeHeader(header, datagram.data());
  return {datagram.data(), datagram.data() + length};
}

Result<DashboardPacket> decodeDashboardDatagram(std::span<const std::uint8_t> datagram) {
  if (datagram.size() < kDashboardHeaderBytes) {
    return Failure{
        fmt::format("the datagram has {} bytes, its header alone takes {}", datagram.size(), kDashboardHeaderBytes)};
  }
  DashboardPacket packet{readHeader(datagram.data()), {}};
  if (packet.header.marker != 1) return Failure{fmt::format("the marker is {} instead of 1", packet.header.marker)};
  if (packet.header.length() != datagram.size()) {
    return Failure{
        fmt::format("the datagram has {} bytes, its header says {}", datagram.size(), packet.header.length())};
  }
  packet.text.assign(datagram.begin() + kDashboardHeaderBytes, datagram.end());
  return packet;
}

std::vector<std::pair<std::string, std::string>> parseDashboardText(std::string_view text) {
  std::vector<std::pair<std::string, std::string>> pairs;
  // Unescapes as it goes. Values may hold spaces: what a key turns out to be is known only at its "=".
  std::string pending;
  std::size_t lastSpace = std::string::npos;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (c == '\\' && i + 1 < text.size()) {
      pending += text[++i];
    } else if (c == '=') {
      std::string key = lastSpace == std::string::npos ? pending : pending.substr(lastSpace + 1);
      if (lastSpace != std::string::npos) pending.resize(lastSpace);
      if (!pairs.empty()) pairs.back().second = std::move(pending);
      pairs.emplace_back(std::move(key), std::string());
      pending.clear();
      lastSpace = std::string::npos;
    } else {
      if (c == ' ') lastSpace = pending.size();
      pending += c;
    }
  }
  if (!pairs.empty()) pairs.back().second = std::move(pending);
  return pairs;
}

std::optional<std::string> writeLocalLog(std::span<const std::uint8_t> datagram) {
  if (datagram.size() < kDashboardHeaderBytes) return std::nullopt;
  const DashboardHeader header = readHeader(datagram.data());
  const std::string_view text(reinterpret_cast<const char*>(datagram.data()) + kDashboardHeaderBytes,
                              datagram.size() - kDashboardHeaderBytes);
  std::string line;
  line.reserve(kDashboardMaximumLogLine);
  fmt::format_to(std::back_inserter(line), "{}.{:03} {} 127.0.0.1 {} {:5} {:5} {:5} {:5} {:5} ", header.timeSeconds,
                 header.timeQuarterMs * 4, header.deviceIDText(), senderCodeForClientType(header.clientType),
                 header.clientVersion(), header.sessionID(), header.eventNumber, header.method, header.respCode);
  line += text.substr(0, text.find('\0'));
  if (line.size() > kDashboardMaximumLogLine) line.resize(kDashboardMaximumLogLine);
  if (!platform::isValidUtf8(line)) return std::nullopt;
  return line;
}

}  // namespace orvanta
