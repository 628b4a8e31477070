#include "session/BackendSet.h"

#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "session/BackendFactory.h"
#include "session/SessionInfoRecord.h"

namespace orvanta {

std::optional<BackendSet> createBackends(DaemonServices& services, const SharedDictionary& storebag,
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
  const auto& device = services.platform.device();

  BackendSetup setup;
  BackendIdentity& identity = setup.identity;
  identity.startTimestamp = services.platform.clock().timeOfDay();
  identity.sessionID = info.sessionID;
  identity.clientType = info.clientType;
  identity.clientVersion = info.clientVersion;
  identity.deviceID = std::string(deviceIDText(deviceID));
  identity.productFamily = device.deviceName().value_or("");
  identity.productVersion = device.productVersion();
  identity.buildVersion = device.buildVersion();
  identity.productType = device.productType();
  identity.isInternal = services.config().isInternalBuild();
  identity.requireUserInfo = info.requireUserInfo;
  identity.selfVersion = SelfVersion::parse(services.config().orvanta().bundleVersion());
  setup.batchEvents = info.batchEvent;
  setup.userInfo = userInfo;

  BackendSet backends;
  for (const auto& [key, value] : *storebag) {
    // The profile stays inside the storebag, which lives as long as any backend made from it.
    const SharedDictionary profile(storebag, value.dictionary());
    auto backend = newBackendWithName(services.backends, key, profile, setup);
    if (backend) backends.add(key, std::move(backend));
  }
  return backends;
}

}  // namespace orvanta
