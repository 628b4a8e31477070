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

struct Arguments {
  Platform& platform;
  const std::string& name;
  const SharedDictionary& profile;
  const std::string& productFamily;
  std::int32_t clientType;
};

template <class Backend>
std::shared_ptr<OrvantaBackend> create(const Arguments& arguments) {
  return Backend::create(arguments.platform, arguments.name, arguments.profile, arguments.productFamily);
}

std::shared_ptr<OrvantaBackend> createBrisk(const Arguments& arguments) {
  return BriskBackend::create(arguments.platform, arguments.name, arguments.profile, arguments.productFamily,
                              arguments.clientType);
}

// Desktop devices have no diagnostics adaptor.
bool supportsBrisk(Platform& platform) {
  return platform.device().productType() != "Deskora";
}

struct BackendClass {
  std::string_view name;
  // Null where the device does not support the class.
  std::shared_ptr<OrvantaBackend> (*create)(const Arguments& arguments);
  bool (*isSupported)(Platform& platform) = nullptr;  // null: everywhere
};

constexpr BackendClass kBackendClasses[] = {
    {kOrvantaBackendDashboard, create<DashboardBackend>}, {kOrvantaBackendUploadServer, create<UploadBackend>},
    {kOrvantaBackendHTTPPost, create<HTTPSPostBackend>},  {kOrvantaBackendHTTPPost2, create<HTTPSPostBackend>},
    {kOrvantaBackendVoltmark, create<VoltmarkBackend>},   {kOrvantaBackendBrisk, createBrisk, supportsBrisk},
};

}  // namespace

std::shared_ptr<OrvantaBackend> newBackendWithName(Platform& platform, const std::string& name,
                                                   const SharedDictionary& profile, const std::string& productFamily,
                                                   std::int32_t clientType) {
  for (const BackendClass& row : kBackendClasses) {
    if (row.name != name) continue;
    if (row.isSupported != nullptr && !row.isSupported(platform)) break;
    if (auto backend = row.create({platform, name, profile, productFamily, clientType})) return backend;
    break;
  }
  ORVANTA_LOG(error, "OrvantaBackend(newBackendWithName): {}", name);
  return nullptr;
}

}  // namespace orvanta
