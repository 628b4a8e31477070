#include "config/Environment.h"

#include "config/DeviceInfo.h"
#include "config/UserDefaultKeys.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {

namespace {

constexpr std::int64_t kEnvironmentTypeCount = 5;

struct Environment {
  EnvironmentType type;
};

EnvironmentType userDefaultsEnvironment(Platform& platform) {
  EnvironmentType type = EnvironmentType::none;
  if (const auto setting = platform.defaults().value(kEnvironmentTypeKey)) {
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
    type = isInternalBuild(platform) ? EnvironmentType::internal : EnvironmentType::seed;
  }
  ORVANTA_LOG(info, "userDefaultsEnvironment: Environment type {}", static_cast<std::uint32_t>(type));
  return type;
}

}  // namespace

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

EnvironmentType currentEnvironmentType(Platform& platform) {
  return platform.once<Environment>([&] { return Environment{userDefaultsEnvironment(platform)}; }).type;
}

}  // namespace orvanta
