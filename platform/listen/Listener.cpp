#include "platform/listen/Listener.h"

#include <utility>

#include "platform/listen/ServiceListener.h"
#include "platform/listen/ServiceSocket.h"

namespace orvanta::platform {

Result<std::unique_ptr<Listener>> Listener::create(WorkPool& pool, const std::string& directory,
                                                   const std::string& service, Handler handler) {
  auto socket = openServiceSocket(directory, service);
  if (!socket) return Failure{socket.error()};
  return create(pool, std::move(*socket), std::move(handler));
}

std::unique_ptr<Listener> Listener::create(WorkPool& pool, ServiceSocket socket, Handler handler) {
  return std::make_unique<ServiceListener>(pool, std::move(socket), std::move(handler), kMaximumConnectionsPerUser);
}

}  // namespace orvanta::platform
