#include "config/Environment.h"

#include "config/ConfigServices.h"
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

const char* environmentSectionName(EnvironmentType type) {
  switch (type) {
    case EnvironmentType::development:
      return "development";
    case EnvironmentType::internal:
      return "kovalt_internal";
    case EnvironmentType::seed:
      return "seed";
    case EnvironmentType::release:
      return "release";
    case EnvironmentType::none:
      break;
  }
  return nullptr;
}
}  // namespace orvanta
