#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "backends/OrvantaBackend.h"

namespace orvanta {

// Copies events into the platform's power log. Called on its session's queue; failures of the log are not observed.
class VoltmarkBackend final : public OrvantaBackend {
 public:
  using OrvantaBackend::OrvantaBackend;
  static std::shared_ptr<VoltmarkBackend> create(BackendServices& services, std::string name, SharedDictionary profile,
                                                 const BackendSetup& setup) {
    return std::make_shared<VoltmarkBackend>(services, std::move(name), std::move(profile), setup);
  }

 protected:
  // Always nullopt. Events of category 0 and events without a payload are left out.
  std::optional<std::string> sendNumbered(const Event& event) override;
};

}  // namespace orvanta
