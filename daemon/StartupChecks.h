#pragma once

#include "session/DaemonServices.h"

namespace orvanta {

// Warns of what in the configuration keeps the daemon from being of use, or is not read at all: a framework bundle
// without a usable verification key, an entitlement that is granted to no one, keys that mean nothing. For main, once:
// what is noticed later, where it is used, is often noticed too late.
void warnOfUselessConfiguration(DaemonServices& services);

}  // namespace orvanta
