#include "daemon/Ending.h"

#include <chrono>

#include "interface/OrvantaLogging.h"

namespace orvanta {

namespace {

// Calls that wait for a server or for memory get their errors, now and from now on.
void endWaiting(DaemonServices& services) {
  services.platform.http().abortBlockingRequests();
  services.backends.uploadBudget.close();
  services.backends.pendingPosts->stopWaiting();
}

void finishDeliveries(Platform& platform) {
  using std::chrono::milliseconds;
  // Datagrams and posts are jobs by now; then they are requests in flight.
  platform.pool().drain(milliseconds(2000));
  platform.http().shutdown(milliseconds(5000));
  platform.pool().drain(milliseconds(1000));
}

}  // namespace

bool endService(platform::Listener& listener, DaemonServices& services, OrvantadAgent& agent) {
  const bool admissionStopped = listener.stop();
  if (!admissionStopped) ORVANTA_LOG(error, "main: A connection is still being admitted and is left behind");
  endWaiting(services);
  const bool sessionsEnded = agent.sessions().endAll();
  finishDeliveries(services.platform);
  agent.sessions().waitForClients();
  return admissionStopped && sessionsEnded;
}

}  // namespace orvanta
