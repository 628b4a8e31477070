#include "session/BackendFactory.h"

#include "backends/VoltmarkBackend.h"
#include "backends/brisk/BriskBackend.h"
#include "backends/dashboard/DashboardBackend.h"
#include "backends/https/HTTPSPostBackend.h"
#include "backends/upload/UploadBackend.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {
namespace {

template <class Backend>
std::shared_ptr<OrvantaBackend> create(BackendServices& services, const std::string& name,
                                       const SharedDictionary& profile, const BackendSetup& setup) {
  return Backend::create(services, name, profile, setup);
}

// Desktop devices have no diagnostics adaptor.
bool supportsBrisk(Platform& platform) {
  return platform.device().productType() != "Deskora";
}

struct BackendClass {
  std::string_view name;
  // Returns null where the profile lacks something.
  std::shared_ptr<OrvantaBackend> (*create)(BackendServices& services, const std::string& name,
                                            const SharedDictionary& profile, const BackendSetup& setup);
  BackendRules rules;
  bool (*isSupported)(Platform& platform) = nullptr;  // null: everywhere
};

constexpr BackendClass kBackendClasses[] = {
    {kOrvantaBackendDashboard, create<DashboardBackend>, {ReplyRole::fallback, 3}},
    {kOrvantaBackendUploadServer, create<UploadBackend>, {}},
    {kOrvantaBackendHTTPPost, create<HTTPSPostBackend>, {ReplyRole::reply, 1}},
    {kOrvantaBackendHTTPPost2, create<HTTPSPostBackend>, {ReplyRole::reply, 2}},
    {kOrvantaBackendVoltmark, create<VoltmarkBackend>, {}},
    {kOrvantaBackendBrisk, create<BriskBackend>, {}, supportsBrisk},
};

}  // namespace

std::shared_ptr<OrvantaBackend> newBackendWithName(BackendServices& services, const std::string& name,
                                                   const SharedDictionary& profile, const BackendSetup& setup) {
  for (const BackendClass& row : kBackendClasses) {
    if (row.name != name) continue;
    if (row.isSupported != nullptr && !row.isSupported(services.platform())) break;
    if (auto backend = row.create(services, name, profile, setup)) return backend;
    break;
  }
  ORVANTA_LOG(error, "OrvantaBackend(newBackendWithName): {}", name);
  return nullptr;
}

BackendRules rulesForBackend(std::string_view name) {
  for (const BackendClass& row : kBackendClasses) {
    if (row.name == name) return row.rules;
  }
  return {};
}

}  // namespace orvanta
