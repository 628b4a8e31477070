#include "util/Environment.h"

#include "interface/OrvantaLogging.h"
#include "util/DeviceInfo.h"

namespace orvanta {

namespace {

constexpr std::uint32_t kEnvironmentTypeCount = 5;

struct Environment {
  EnvironmentType type;
};

EnvironmentType userDefaultsEnvironment(platform::Platform& platform) {
  EnvironmentType type = EnvironmentType::none;
  if (const auto setting = platform.defaults().value("environmentType")) {
    const auto number = static_cast<std::uint32_t>(setting->integerValue());
    type = static_cast<EnvironmentType>(number);
    if (number >= kEnvironmentTypeCount) {
      ORVANTA_LOG(error, "userDefaultsEnvironment: Invalid environment type {}", number);
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

EnvironmentType currentEnvironmentType(platform::Platform& platform) {
  return platform.once<Environment>([&] { return Environment{userDefaultsEnvironment(platform)}; }).type;
}

}  // namespace orvanta
