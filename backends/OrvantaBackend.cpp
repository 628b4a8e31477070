#include "backends/OrvantaBackend.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <span>

#include "platform/core/Text.h"
#include "platform/host/Digest.h"

namespace orvanta {
namespace {

// Never seeded: the draws are the generator's default sequence from process start.
double nextSamplingDraw() {
  static platform::Mutex mutex;
  const platform::MutexLock lock(mutex);
  return ::drand48();
}

bool holdsCategory(const std::vector<std::int32_t>& list, std::uint16_t category) {
  return std::find(list.begin(), list.end(), static_cast<std::int32_t>(category)) != list.end();
}

}  // namespace

OrvantaBackend::OrvantaBackend(BackendServices& services, std::string name, SharedDictionary profile,
                               const BackendSetup& setup)
    : _services(services),
      _name(std::move(name)),
      _profile(std::move(profile)),
      _identity(setup.identity),
      _samplingFactor(nextSamplingDraw()),
      _batchEvents(setup.batchEvents),
      _userInfoDict(setup.userInfo) {}

OrvantaBackend::~OrvantaBackend() = default;

std::optional<std::string> OrvantaBackend::sendMessage(Event& event) {
  event.number = ++_eventID;
  return sendNumbered(event);
}

std::optional<std::string> OrvantaBackend::sendNumbered(const Event& /*event*/) {
  return std::nullopt;
}

std::optional<std::string> OrvantaBackend::flushMessagesWithCompletion(FlushCompletion completion) {
  if (completion) completion(std::nullopt, std::nullopt);
  return std::nullopt;
}

bool OrvantaBackend::uploadFileAtPath(const UploadFile& /*file*/) {
  return false;
}

bool OrvantaBackend::uploadLogData(const SharedArray& /*logData*/) {
  return false;
}

bool OrvantaBackend::isWhitelistedEvent(std::uint16_t category) const {
  return !_eventWhitelist || holdsCategory(*_eventWhitelist, category);
}

bool OrvantaBackend::isBlacklistedEvent(std::uint16_t category) const {
  return _eventBlacklist && holdsCategory(*_eventBlacklist, category);
}

std::optional<double> OrvantaBackend::samplingThreshold() const {
  const platform::MutexLock lock(_mutex);
  return _samplingThreshold;
}

void OrvantaBackend::setSamplingThreshold(std::optional<double> threshold) {
  const platform::MutexLock lock(_mutex);
  _samplingThreshold = threshold;
}

std::optional<std::string> OrvantaBackend::combinedSessionIDString() const {
  const platform::MutexLock lock(_mutex);
  return _combinedSessionIDString;
}

void OrvantaBackend::setCombinedSessionIDString(std::optional<std::string> combined) {
  const platform::MutexLock lock(_mutex);
  _combinedSessionIDString.swap(combined);
}

SelfVersion SelfVersion::parse(std::string_view text) {
  std::array<std::uint8_t, 3> parts{};
  for (std::uint8_t& part : parts) {
    const std::size_t dot = text.find('.');
    part = static_cast<std::uint8_t>(Value(text.substr(0, dot)).integerValue());
    if (dot == std::string_view::npos) break;
    text.remove_prefix(dot + 1);
  }
  return {parts[0], parts[1], parts[2]};
}

std::string SelfVersion::text() const {
  return minor == 0 ? fmt::format("{}.{}", major, middle) : fmt::format("{}.{}.{}", major, middle, minor);
}

std::string OrvantaBackend::convertIntoSHA256(std::string_view text) {
  const std::span bytes(reinterpret_cast<const std::uint8_t*>(text.data()), text.size());
  return platform::hexText(platform::sha256(bytes));
}

}  // namespace orvanta
