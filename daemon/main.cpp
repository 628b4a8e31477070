#include <cstdlib>
#include <utility>

#include "daemon/DaemonPlatform.h"
#include "daemon/Ending.h"
#include "daemon/OrvantadAgent.h"
#include "daemon/StartupChecks.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "interface/RemoteCalls.h"
#include "interface/WireLimits.h"
#include "platform/host/KeepAlive.h"
#include "platform/host/Process.h"
#include "platform/listen/Listener.h"
#include "platform/listen/ServiceSocket.h"
#include "platform/sandbox/Sandbox.h"

int main() {
  using namespace orvanta;

  platform::secureStandardDescriptors();
  platform::enterUtilitySchedulingClass();
  platform::tuneAllocator();
  OrvantaLogging::startLogging("orvantad", "Daemon");
  const auto files = FileLocations::fromEnvironment();
  auto sandbox = enterDaemonSandbox(files);
  if (!sandbox) return -1;

  platform::blockTerminationSignals();
  auto socket = platform::openServiceSocket(files.runtimeDirectory, std::string(kOrvantaServiceName));
  if (!socket) {
    ORVANTA_LOG(error, "main: {}", socket.error());
    return 1;
  }
  if (!closeDaemonSandbox(*sandbox)) return -1;
  const auto device = makeDaemonPlatform(files);
  DaemonServices services(*device);
  OrvantadAgent agent(services);
  auto listener = platform::Listener::create(device->pool(), std::move(*socket),
                                             {kDaemonConnectionLimits, kMaximumConnectionsPerUser},
                                             [&agent](platform::OfferedConnection&& offered) {
                                               return agent.listenerShouldAcceptNewConnection(std::move(offered));
                                             });
  warnOfUselessConfiguration(services);
  device->pool().start();
  listener->resume();
  platform::KeepAlive::ready();
  ORVANTA_LOG(info, "main: Listener resumes with sandbox, start loop.");
  platform::releaseUnusedMemory();  // what only the start needed

  const int signal = platform::waitForTermination();
  ORVANTA_LOG(info, "main: Ending on signal {}", signal);
  platform::KeepAlive::stopping();
  if (!endService(*listener, services, agent)) std::_Exit(0);
  listener.reset();
  device->pool().stop();
  sandbox.reset();  // its watcher logs, too
  OrvantaLogging::close();
  return 0;
}
