#pragma once

#include <string>

#include "platform/core/Result.h"
#include "platform/core/UniqueFd.h"

namespace orvanta::platform {

// Connects to the named service whose socket lies in `directory`: the client's counterpart of Listener. Does not block;
// the socket is non-blocking and close-on-exec. Any thread.
//
// On failure `*errorNumber`, where given, tells apart what the text only says: ENOENT (no such socket: nothing runs
// there), ECONNREFUSED (a socket file without a listener), EACCES, EAGAIN (the service has too many waiting),
// ENAMETOOLONG. It is 0 on success.
Result<UniqueFd> connectToService(const std::string& directory, const std::string& service, int* errorNumber = nullptr);

}  // namespace orvanta::platform
