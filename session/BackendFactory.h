#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "backends/OrvantaBackend.h"

namespace orvanta {

// Makes the backend of that name, or null: the name is unknown (logged), the profile lacks something (logged by the
// class) or the device does not support it.
std::shared_ptr<OrvantaBackend> newBackendWithName(BackendServices& services, const std::string& name,
                                                   const SharedDictionary& profile, const BackendSetup& setup);

}  // namespace orvanta
