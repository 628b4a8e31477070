#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

// The binary property list, "bplist00": the magic, the objects, a table of their offsets, a trailer of 32 bytes.
namespace orvanta::platform::binary_property_list {

inline constexpr std::array<std::uint8_t, 8> kMagic{'b', 'p', 'l', 'i', 's', 't', '0', '0'};

// The trailer: five unused bytes and a sort version, then the fields at these offsets.
inline constexpr std::size_t kTrailerSize = 32;
inline constexpr std::size_t kOffsetSizeAt = 6;
inline constexpr std::size_t kReferenceSizeAt = 7;
inline constexpr std::size_t kObjectCountAt = 8;
inline constexpr std::size_t kTopObjectAt = 16;
inline constexpr std::size_t kOffsetTableAt = 24;

// An object's first byte: the kind in the high half, in the low half a count, a power of two or one of the three below.
inline constexpr std::uint8_t kSimple = 0x0;
inline constexpr std::uint8_t kInteger = 0x1;
inline constexpr std::uint8_t kReal = 0x2;
inline constexpr std::uint8_t kDate = 0x3;
inline constexpr std::uint8_t kData = 0x4;
inline constexpr std::uint8_t kAscii = 0x5;
inline constexpr std::uint8_t kUtf16 = 0x6;
inline constexpr std::uint8_t kUid = 0x8;
inline constexpr std::uint8_t kArray = 0xa;
inline constexpr std::uint8_t kOrderedSet = 0xb;
inline constexpr std::uint8_t kSet = 0xc;
inline constexpr std::uint8_t kDictionary = 0xd;

inline constexpr std::uint8_t kNullMarker = 0x0;
inline constexpr std::uint8_t kFalseMarker = 0x8;
inline constexpr std::uint8_t kTrueMarker = 0x9;
inline constexpr std::uint8_t kCountFollows = 0xf;

// Dates count from 2001-01-01T00:00:00Z.
inline constexpr double kEpochOffset = 978307200;

}  // namespace orvanta::platform::binary_property_list
