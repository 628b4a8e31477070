#include "daemon/StartupChecks.h"

#include "config/UserDefaultKeys.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "platform/core/Text.h"

namespace orvanta {

namespace {

void warnOfUnknownUserDefaults(Platform& platform) {
  static constexpr std::string_view kKeys[] = {kStorebagURLKey,     kEnvironmentTypeKey,   kPostURLKey,
                                               kRealtimePostURLKey, kForceEventLoggingKey, kRespectConsentKey,
                                               kOverrideConsentKey};
  const std::string identifiers = std::string(kIdentifierPrefix) + ":";
  Dictionary settings;
  for (auto& [key, value] : platform.defaults().all()) {
    if (key.rfind(identifiers, 0) != 0) settings.set(key, true);
  }
  if (const std::string unknown = platform::describeUnknownKeys(settings, kKeys); !unknown.empty()) {
    ORVANTA_LOG(warning, "main: {} in {}", unknown, platform.defaults().path());
  }
}

}  // namespace

void warnOfUselessConfiguration(DaemonServices& services) {
  Platform& platform = services.platform;
  // The reader of a file logs the keys in it that nothing uses: the device and the framework read theirs here.
  platform.device().productVersion();
  warnOfUnknownUserDefaults(platform);
  if (!platform.device().deviceName()) {
    ORVANTA_LOG(warning, "main: The device has no \"DeviceName\" in {}/device.plist, no session will report by https",
                platform.files().configurationDirectory);
  }
  if (const auto key = services.config().orvanta().readPublicKey(); !key) {
    ORVANTA_LOG(warning, "main: The framework bundle has no usable verification key, no storebag will be accepted: {}",
                key.error());
  }
  if (!services.entitlements.isHeldByAnybody(kOrvantaEntitlement)) {
    ORVANTA_LOG(warning,
                "main: The entitlement {} is granted to nobody in {}/entitlements.d, no client will be admitted",
                kOrvantaEntitlement, platform.files().configurationDirectory);
  }
}

}  // namespace orvanta
