#pragma once

#include <map>
#include <memory>
#include <string>

#include "config/Platform.h"
#include "platform/sandbox/Sandbox.h"

namespace orvanta {

// The Linux device that orvantad runs on. Starts no thread but the HTTP client's; the pool is started by main.
std::unique_ptr<Platform> makeDaemonPlatform(FileLocations files);

// The values of the sandbox profile's ${NAME} places.
std::map<std::string, std::string> sandboxVariables(const FileLocations& files);

// Enters the service's sandbox, or says why not and returns null. ORVANTA_SANDBOX=off stays outside, with a warning.
std::unique_ptr<platform::Sandbox> enterDaemonSandbox(const FileLocations& files);
// Closes the sandbox further once the daemon has its socket: from then on it can listen nowhere else. Before the first
// thread, so that it holds for all. Returns false, with the reason in the log, when it cannot.
bool closeDaemonSandbox(platform::Sandbox& sandbox);

}  // namespace orvanta
