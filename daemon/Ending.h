#pragma once

#include "daemon/OrvantadAgent.h"
#include "platform/listen/Listener.h"
#include "session/DaemonServices.h"

namespace orvanta {

// Ends the service in order, on the main thread: no client is admitted any more, calls that wait get their errors,
// sessions end while their clients can still hear of it, and what they leave gets a few seconds to go out. False when
// some thread is still busy with a client's call: none may be joined then, and nothing destroyed.
bool endService(platform::Listener& listener, DaemonServices& services, OrvantadAgent& agent);

}  // namespace orvanta
