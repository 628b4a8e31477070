#include "tools/orvantactl/ConfiguredSession.h"

#include <fmt/format.h>

#include <utility>

#include "tools/orvantactl/Output.h"

namespace orvanta::ctl {

std::optional<SessionRecords> recordsOrComplain(const ClientOptions& options, int& status) {
  auto userInfo = options.userInfo();
  if (userInfo) return SessionRecords{options.sessionInfo(), std::move(*userInfo)};
  complain(userInfo.error());
  status = kUsage;
  return std::nullopt;
}

std::unique_ptr<OrvantaConnection> connectOrComplain(const ClientOptions& options, int& status) {
  auto connected = OrvantaConnection::connect({.socketDirectory = options.socketDirectory});
  if (connected) return std::move(*connected);
  status = complain(connected.error());
  return nullptr;
}

ConfiguredSession configureOrComplain(const ClientOptions& options, int& status) {
  const auto records = recordsOrComplain(options, status);
  if (!records) return {};
  auto connection = connectOrComplain(options, status);
  if (!connection) return {};
  auto backends = connection->session().blocking().configure(records->sessionInfo, records->userInfo);
  if (!backends) {
    status = complain(backends.error());
    return {};
  }
  if (!*backends) {
    complain(
        fmt::format("the daemon has no storebag for client type {}, so nothing will be reported: is the storebag "
                    "server up, and does it serve this type? The daemon's log says more.",
                    options.clientType));
    status = kSomethingNotTaken;
  }
  return {std::move(connection), std::move(*backends)};
}

}  // namespace orvanta::ctl
