#include "daemon/Ending.h"

#include <chrono>

#include "backends/https/PendingPosts.h"
#include "backends/upload/UploadBudget.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {

namespace {

// Calls that wait for a server or for memory get their errors, now and from now on.
void endWaiting(Platform& platform) {
  platform.http().abortBlockingRequests();
  UploadBudget::of(platform).close();
  PendingPosts::of(platform)->stopWaiting();
}

void finishDeliveries(Platform& platform) {
  using std::chrono::milliseconds;
  // Datagrams and posts are jobs by now; then they are requests in flight.
  platform.pool().drain(milliseconds(2000));
  platform.http().shutdown(milliseconds(5000));
  platform.pool().drain(milliseconds(1000));
}

}  // namespace

bool endService(platform::Listener& listener, Platform& platform, OrvantadAgent& agent) {
  const bool admissionStopped = listener.stop();
  if (!admissionStopped) ORVANTA_LOG(error, "main: A connection is still being admitted and is left behind");
  endWaiting(platform);
  const bool sessionsEnded = agent.sessions().endAll();
  finishDeliveries(platform);
  agent.sessions().waitForClients();
  return admissionStopped && sessionsEnded;
}

}  // namespace orvanta
