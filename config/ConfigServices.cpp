#include "config/ConfigServices.h"

#include <utility>

#include "config/UserDefaultKeys.h"

namespace orvanta {

namespace {
constexpr const char* kInternalServer = "https://internal-bags.kovalt.com/storebags/tamrel";
constexpr const char* kPublicServer = "https://bags.kovalt.com/bags/tamrel";
}  // namespace

bool ConfigServices::isInternalBuild() {
  return _internalBuild.get([this] { return _platform.device().releaseType() == "Internal"; });
}

EnvironmentType ConfigServices::currentEnvironmentType() {
  return _environmentType.get([this] { return userDefaultsEnvironment(*this); });
}

const std::string& ConfigServices::storebagServerURL() {
  return _storebagServerURL.get([this] {
    auto url = _platform.defaults().text(kStorebagURLKey);
    if (!url) url = isInternalBuild() ? kInternalServer : kPublicServer;
    return std::move(*url);
  });
}

const std::shared_ptr<platform::HttpLane>& ConfigServices::storebagLane() {
  return _storebagLane.get([this] { return _platform.http().makeLane(platform::HttpClient::LaneKind::unrefused); });
}

Orvanta& ConfigServices::orvanta() {
  return *_orvanta.get([this] { return std::make_unique<Orvanta>(_platform); });
}

}  // namespace orvanta
