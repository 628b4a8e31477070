#include "backends/brisk/BriskBackend.h"

#include <utility>

#include "config/ClientTypes.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {

std::shared_ptr<BriskBackend> BriskBackend::create(BackendServices& services, std::string name,
                                                   SharedDictionary profile, const BackendSetup& setup) {
  const std::int32_t clientType = setup.identity.clientType;
  auto backend = std::make_shared<BriskBackend>(Made{}, services, std::move(name), std::move(profile), setup);
  ORVANTA_LOG(info, "BriskBackend(initWithName): Loading Brisk adaptor class for client type {}", clientType);
  if (!isClientTypeAllowed(clientType)) {
    ORVANTA_LOG(error, "BriskBackend(initWithName): No matching bundle found for client type {}", clientType);
    return nullptr;
  }
  backend->_briskAdaptor = BriskAdaptor::create(services);
  return backend;
}

BriskBackend::BriskBackend(Made, BackendServices& services, std::string name, SharedDictionary profile,
                           const BackendSetup& setup)
    : OrvantaBackend(services, std::move(name), std::move(profile), setup) {}

bool BriskBackend::isClientTypeAllowed(std::int32_t clientType) {
  return clientType == kClientTypeXF || clientType == kClientTypeZJ || clientType == kClientTypeZEPHQ;
}

std::optional<std::string> BriskBackend::sendNumbered(const Event& event) {
  if (_briskAdaptor && _briskAdaptor->respondsToForwarding()) {
    _briskAdaptor->sendMessage(event);
  } else {
    ORVANTA_LOG(error, "BriskBackend(sendMessage): Brisk adaptor {} does not respond to forwarding selector {}",
                _briskAdaptor ? BriskAdaptor::description() : "(null)", BriskAdaptor::kForwardingOperation);
  }
  return std::nullopt;
}

}  // namespace orvanta
