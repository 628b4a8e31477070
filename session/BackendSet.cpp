#include "session/BackendSet.h"

#include "config/Orvanta.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "session/BackendFactory.h"
#include "session/SessionInfoRecord.h"

namespace orvanta {

std::optional<BackendSet> createBackends(Platform& platform, const SharedDictionary& storebag,
                                         const SharedDictionary& sessionInfo, const SharedDictionary& userInfo,
                                         const DeviceIDBuffer& deviceID) {
  if (!storebag) {
    ORVANTA_LOG(error, "createBackends: Attempted to create backends with nil storebag");
    return std::nullopt;
  }
  if (!sessionInfo) {
    ORVANTA_LOG(error, "createBackends: Attempted to create backends with nil session info");
    return std::nullopt;
  }

  const SessionInfoRecord info = SessionInfoRecord::read(*sessionInfo);
  const auto& device = platform.device();
  const std::string productFamily = device.deviceName().value_or("");

  BackendIdentity identity;
  identity.startTimestamp = platform.clock().timeOfDay();
  identity.sessionID = info.sessionID;
  identity.compType = info.clientType;
  identity.clientVersion = info.clientVersion;
  identity.udid = std::string(deviceIDText(deviceID));
  identity.productVersion = device.productVersion();
  identity.buildVersion = device.buildVersion();
  identity.hardwareType = device.productType();
  identity.isInternal = isInternalBuild(platform);
  identity.requireUserInfo = info.requireUserInfo;
  identity.selfVersion = Orvanta::of(platform).bundleVersion();

  BackendSet backends;
  for (const auto& [key, value] : *storebag) {
    // The profile stays inside the storebag, which lives as long as any backend made from it.
    const SharedDictionary profile(storebag, value.dictionary());
    auto backend = newBackendWithName(platform, key, profile, productFamily, info.clientType);
    if (!backend) continue;
    backend->setIdentity(identity);
    backend->setBatchEvents(info.batchEvent);
    backend->setUserInfoDict(userInfo);
    backends.add(key, std::move(backend));
  }
  return backends;
}

}  // namespace orvanta
