#include "config/DeviceInfo.h"

#include <algorithm>
#include <cstring>

#include "config/UserDefaultKeys.h"
#include "interface/OrvantaLogging.h"
#include "interface/Values.h"
#include "platform/host/Digest.h"

namespace orvanta {

namespace {

// The longest beginning of `text` that fits `limit` bytes and does not cut a UTF-8 sequence.
std::string_view cutWhole(std::string_view text, std::size_t limit) {
  if (text.size() <= limit) return text;
  std::size_t end = limit;
  while (end > 0 && (static_cast<unsigned char>(text[end]) & 0xC0U) == 0x80U) --end;
  return text.substr(0, end);
}

}  // namespace

void copyUniqueDeviceID(Platform& platform, DeviceIDBuffer& buffer) {
  const auto identifier = platform.device().uniqueDeviceID();
  if (!identifier) return;
  const std::string_view text = cutWhole(*identifier, buffer.size() - 1);
  char* end = std::copy(text.begin(), text.end(), buffer.data());
  std::fill(end, buffer.data() + buffer.size(), '\0');
}

std::string_view deviceIDText(const DeviceIDBuffer& buffer) {
  return {buffer.data(), ::strnlen(buffer.data(), buffer.size())};
}

std::string getPersistentIdentifierForCustomClientIDSuffix(Platform& platform, const std::optional<std::string>& first,
                                                           const std::optional<std::string>& second) {
  std::string key(kIdentifierPrefix);
  key.append(":").append(first.value_or("")).append(":").append(second.value_or(""));
  Value value = platform.defaults().valueOrStore(key, [] { return Value(platform::uuidText(platform::randomUuid())); });
  std::string identifier = value.string() != nullptr ? std::move(*value.string()) : value.description();
  ORVANTA_LOG(info, "getPersistentIdentifierForCustomClientIDSuffix: The value for {}: {}", key, identifier);
  return identifier;
}

}  // namespace orvanta
