#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "backends/Event.h"
#include "interface/Values.h"

namespace orvanta {

// The datagram of one event, as bytes and back. Pure functions: no I/O, no clock; any thread.

inline constexpr std::size_t kDashboardHeaderBytes = 64;
inline constexpr std::size_t kDashboardMaximumText = 1023;
inline constexpr std::size_t kDashboardMaximumLogLine = 1151;
inline constexpr std::size_t kDashboardEventNumberOffset = 60;  // in a datagram and in its acknowledgement

// The header's fields in host order; on the wire they follow each other big-endian, without gaps.
struct DashboardHeader {
  static constexpr std::uint16_t kModeAcknowledged = 1;    // the server is to acknowledge
  static constexpr std::uint16_t kModeExplicitServer = 2;  // the server's address did not come from a profile

  std::uint8_t versionMajor = 0;
  std::uint8_t clientType = 0;
  std::uint8_t marker = 1;
  std::uint8_t timeQuarterMs = 0;  // in units of 4 ms
  std::uint32_t timeSeconds = 0;
  std::uint32_t sessionIDComplement = 0;
  std::uint16_t clientVersionComplement = 0;
  std::uint16_t lengthComplement = 0;  // of the whole datagram
  std::uint16_t method = 0;
  std::uint16_t respCode = 0;
  std::array<char, 40> deviceID{};  // zeros behind a shorter one
  std::uint16_t eventNumber = 0;
  std::uint16_t mode = 0;

  std::uint32_t sessionID() const { return ~sessionIDComplement; }
  std::uint16_t clientVersion() const { return static_cast<std::uint16_t>(~clientVersionComplement); }
  std::size_t length() const { return static_cast<std::uint16_t>(~lengthComplement); }
  std::string_view deviceIDText() const;  // up to the first zero
};

struct DashboardPacket {
  DashboardHeader header;
  std::string text;
};

// The fields that a backend puts into every datagram.
struct DashboardSender {
  std::uint8_t versionMajor = 0;
  std::int32_t clientType = 0;
  std::uint32_t sessionID = 0;
  std::uint16_t clientVersion = 0;
  std::string_view deviceID;
  std::uint16_t mode = 0;
};

// The whole datagram. The text is " key=value" for each pair of the payload, in the order of their values' lengths in
// bytes, shortest first, so that a cut at the maximum loses the fewest pairs; equal lengths keep the keys' order. A
// zero byte ends the key or value that holds it.
std::vector<std::uint8_t> encodeDashboardDatagram(const DashboardSender& sender, const Event& event);

// A failure says what is wrong: shorter than a header, another marker, a length that is not the datagram's.
Result<DashboardPacket> decodeDashboardDatagram(std::span<const std::uint8_t> datagram);

// The pairs of a datagram's text, unescaped, for keys without spaces and "=". A pair that was cut before its
// "=" cannot be told from the end of the value before it.
std::vector<std::pair<std::string, std::string>> parseDashboardText(std::string_view text);

// The log line of a datagram that encodeDashboardDatagram() made, or that decodes; nullopt when it is not UTF-8.
std::optional<std::string> writeLocalLog(std::span<const std::uint8_t> datagram);

}  // namespace orvanta
