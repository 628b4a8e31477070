#include "daemon/StartupChecks.h"

#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "platform/Entitlements.h"
#include "util/Orvanta.h"

namespace orvanta {

void warnOfUselessConfiguration(platform::Platform& platform) {
  // Whoever reads a file logs the keys in it that nothing reads: these two read theirs here.
  platform.device().productVersion();
  if (const auto key = Orvanta::of(platform).readPublicKey(); !key) {
    ORVANTA_LOG(warning, "main: The framework bundle has no usable verification key, no storebag will be accepted: {}",
                key.error());
  }
  if (!platform::Entitlements::of(platform).isHeldByAnybody(kOrvantaEntitlement)) {
    ORVANTA_LOG(warning,
                "main: The entitlement {} is granted to nobody in {}/entitlements.d, no client will be admitted",
                kOrvantaEntitlement, platform.files().configurationDirectory);
  }
}

}  // namespace orvanta
