#pragma once

#include <memory>

#include "client/OrvantaConnection.h"
#include "tools/orvantactl/ClientOptions.h"

namespace orvanta::ctl {

// A connection whose session has been set up, as most commands want it.
struct ConfiguredSession {
  std::unique_ptr<OrvantaConnection> connection;  // null: it has been said why not, and `status` is set
  BackendNames backends;
};

// Connects and configures. That the daemon has no storebag for the client type counts as not taken.
ConfiguredSession configureOrComplain(const ClientOptions& options, int& status);

}  // namespace orvanta::ctl
