#include "config/Environment.h"

#include "config/ConfigServices.h"
#include "config/StorebagKeys.h"
#include "config/UserDefaultKeys.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {

namespace {

constexpr std::int64_t kEnvironmentTypeCount = 5;

}  // namespace

EnvironmentType userDefaultsEnvironment(ConfigServices& services) {
  EnvironmentType type = EnvironmentType::none;
  if (const auto setting = services.platform().defaults().value(kEnvironmentTypeKey)) {
    const std::int64_t number = setting->integerValue();
    if (number >= 0 && number < kEnvironmentTypeCount) {
      type = static_cast<EnvironmentType>(number);
    } else {
      // A negative number is shown as the unsigned one of 32 bits that it stands for.
      ORVANTA_LOG(error, "userDefaultsEnvironment: Invalid environment type {}",
                  number < 0 ? static_cast<std::uint32_t>(number) : static_cast<std::uint64_t>(number));
      type = EnvironmentType::internal;
    }
  } else {
    type = services.isInternalBuild() ? EnvironmentType::internal : EnvironmentType::seed;
  }
  ORVANTA_LOG(info, "userDefaultsEnvironment: Environment type {}", static_cast<std::uint32_t>(type));
  return type;
}

std::string_view environmentSectionName(EnvironmentType type) {
  switch (type) {
    case EnvironmentType::development:
      return nameOf(StorebagKey::bagDevelopment);
    case EnvironmentType::internal:
      return nameOf(StorebagKey::bagInternal);
    case EnvironmentType::seed:
      return nameOf(StorebagKey::bagSeed);
    case EnvironmentType::release:
      return nameOf(StorebagKey::bagRelease);
    case EnvironmentType::none:
      break;
  }
  return {};
}
}  // namespace orvanta
