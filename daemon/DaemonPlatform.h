#pragma once

#include <map>
#include <memory>
#include <string>

#include "config/Platform.h"
#include "platform/sandbox/Sandbox.h"

namespace orvanta {

// The Linux device that orvantad runs on. Starts no thread but the HTTP client's; the pool is started by main.
std::unique_ptr<Platform> makeDaemonPlatform(FileLocations files);

// What the sandbox profile's ${NAME} places stand for.
std::map<std::string, std::string> sandboxVariables(const FileLocations& files);

// Enters the service's sandbox, or says why not and returns null. ORVANTA_SANDBOX=off stays outside, with a warning.
std::unique_ptr<platform::Sandbox> enterDaemonSandbox(const FileLocations& files);
// What the sandbox does once the daemon has its socket: from then on nobody listens anywhere else. Before the first
// thread, so that it holds for all. False, with the reason in the log, when it cannot.
bool closeDaemonSandbox(platform::Sandbox& sandbox);

}  // namespace orvanta
