#include <chrono>

#include "daemon/DaemonPlatform.h"
#include "daemon/OrvantadAgent.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "platform/KeepAlive.h"
#include "platform/Listener.h"
#include "platform/MemoryUse.h"
#include "platform/Process.h"

int main() {
  using namespace orvanta;
  using std::chrono::milliseconds;

  platform::enterUtilitySchedulingClass();
  platform::tuneAllocator();
  OrvantaLogging::startLogging("orvantad", "Daemon");
  const auto files = platform::FileLocations::fromEnvironment();
  if (!enterDaemonSandbox(files)) return -1;

  platform::blockTerminationSignals();
  const auto device = makeDaemonPlatform(files);
  OrvantadAgent agent(*device);
  auto listener = platform::Listener::create(device->pool(), files.runtimeDirectory, std::string(kOrvantaServiceName),
                                             [&agent](platform::OfferedConnection&& offered) {
                                               return agent.listenerShouldAcceptNewConnection(std::move(offered));
                                             });
  if (!listener) {
    ORVANTA_LOG(error, "main: {}", listener.error());
    return 1;
  }
  device->pool().start();
  (*listener)->resume();
  platform::KeepAlive::ready();
  ORVANTA_LOG(info, "main: Listener resumes with sandbox, start loop.");
  platform::releaseUnusedMemory();  // what only the start needed

  const int signal = platform::waitForTermination();

  ORVANTA_LOG(info, "main: Ending on signal {}", signal);
  platform::KeepAlive::stopping();
  (*listener)->stop();
  device->http().abortBlockingRequests();
  agent.endAllSessions();
  // Datagrams and posts that the sessions' ends made are jobs by now; then they are requests in flight.
  device->pool().drain(milliseconds(2000));
  device->http().shutdown(milliseconds(5000));
  device->pool().drain(milliseconds(1000));
  listener.value().reset();
  device->pool().stop();
  OrvantaLogging::close();
  return 0;
}
