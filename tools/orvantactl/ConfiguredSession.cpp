#include "tools/orvantactl/ConfiguredSession.h"

#include <fmt/format.h>

#include <utility>

#include "tools/orvantactl/ExitStatus.h"

namespace orvanta::ctl {

ConfiguredSession configureOrComplain(const ClientOptions& options, int& status) {
  const auto userInfo = options.userInfo();
  if (!userInfo) {
    complain(userInfo.error());
    status = kUsage;
    return {};
  }
  auto connection = connectOrComplain(options, status);
  if (!connection) return {};
  auto backends = connection->session().blocking().configure(options.sessionInfo(), *userInfo);
  if (!backends) {
    status = complain(backends.error());
    return {};
  }
  if (!*backends) {
    complain(
        fmt::format("the daemon has no storebag for client type {}: is the storebag server up, and does it serve "
                    "this type? The daemon's log says more.",
                    options.clientType));
    status = kSomethingNotTaken;
    return {};
  }
  return {std::move(connection), std::move(*backends)};
}

}  // namespace orvanta::ctl
