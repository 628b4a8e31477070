#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/OrvantaBackend.h"
#include "backends/brisk/BriskAdaptor.h"

namespace orvanta {

// Forwards each event to the device's diagnostics adaptor. Called on its session's queue, and so is the adaptor, during
// the send. Without an adaptor the backend exists all the same, and each event leaves an error line.
class BriskBackend final : public OrvantaBackend {
  struct Made {};  // only the factories have one

 public:
  // Null, with a log line, for client types that have no adaptor.
  static std::shared_ptr<BriskBackend> create(BackendServices& services, std::string name, SharedDictionary profile,
                                              const BackendSetup& setup);
  BriskBackend(Made, BackendServices& services, std::string name, SharedDictionary profile, const BackendSetup& setup);

  static bool isClientTypeAllowed(std::int32_t clientType);

 protected:
  // Always nullopt.
  std::optional<std::string> sendNumbered(const Event& event) override;

 private:
  std::unique_ptr<BriskAdaptor> _briskAdaptor;  // may be null; constant after set-up
};

}  // namespace orvanta
