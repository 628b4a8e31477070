#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/core/Result.h"
#include "platform/core/Value.h"

namespace orvanta::platform {

struct PropertyListLimits {
  std::size_t maximumDepth = 128;
  std::size_t maximumObjects = 1'000'000;  // values given out, shared ones counted each time
  std::size_t maximumBytes = 64U << 20U;   // of the document; in the binary form also of all text and data given out
};

// Reads either form, chosen by the first bytes. A failure says what and where (byte offset); a repeated key is one.
Result<Value> parsePropertyList(std::span<const std::uint8_t> bytes, const PropertyListLimits& limits = {});
Result<Value> parseXmlPropertyList(std::span<const std::uint8_t> bytes, const PropertyListLimits& limits = {});
Result<Value> parseBinaryPropertyList(std::span<const std::uint8_t> bytes, const PropertyListLimits& limits = {});

// Writers. They fail for what the form cannot carry (null; in XML, text with characters that XML has no way to write).
// The XML form has no DOCTYPE.
Result<std::string> writeXmlPropertyList(const Value& value);
Result<std::vector<std::uint8_t>> writeBinaryPropertyList(const Value& value);

// Reads a whole file and parses it. The failure names the file.
Result<Value> readPropertyListFile(const std::string& path, const PropertyListLimits& limits = {});

std::string encodeBase64(std::span<const std::uint8_t> bytes);
// Skips characters outside the alphabet, as property lists and storebags ask; nullopt when the rest is not
// base64 (a lone trailing character, or text behind the padding).
std::optional<std::vector<std::uint8_t>> decodeBase64(std::string_view text);

}  // namespace orvanta::platform
