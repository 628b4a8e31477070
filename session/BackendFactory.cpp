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
  // Null where the device does not support the class.
  std::shared_ptr<OrvantaBackend> (*create)(BackendServices& services, const std::string& name,
                                            const SharedDictionary& profile, const BackendSetup& setup);
  bool (*isSupported)(Platform& platform) = nullptr;  // null: everywhere
};

constexpr BackendClass kBackendClasses[] = {
    {kOrvantaBackendDashboard, create<DashboardBackend>}, {kOrvantaBackendUploadServer, create<UploadBackend>},
    {kOrvantaBackendHTTPPost, create<HTTPSPostBackend>},  {kOrvantaBackendHTTPPost2, create<HTTPSPostBackend>},
    {kOrvantaBackendVoltmark, create<VoltmarkBackend>},   {kOrvantaBackendBrisk, create<BriskBackend>, supportsBrisk},
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

}  // namespace orvanta
