#include "platform/host/Process.h"

#include <fcntl.h>
#include <pthread.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>

#include "platform/core/Log.h"

namespace orvanta::platform {

namespace {
sigset_t terminationSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  return signals;
}
}  // namespace

void secureStandardDescriptors() {
  for (const int standard : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    // What is opened gets the lowest free number, which is this one, as those below it are open by now.
    if (::fcntl(standard, F_GETFD) < 0 && errno == EBADF) ::open("/dev/null", O_RDWR);
  }
}

void enterUtilitySchedulingClass() {
  constexpr int kUtilityNice = 5;
  if (::setpriority(PRIO_PROCESS, 0, kUtilityNice) != 0) {
    PLATFORM_LOG(info, "enterUtilitySchedulingClass: The scheduling priority stays as it is (error {})", errno);
  }
}

void blockTerminationSignals() {
  const sigset_t signals = terminationSignals();
  ::pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  ::signal(SIGPIPE, SIG_IGN);
}

int waitForTermination() {
  const sigset_t signals = terminationSignals();
  for (;;) {
    const int signal = ::sigwaitinfo(&signals, nullptr);
    if (signal > 0) return signal;
  }
}

}  // namespace orvanta::platform
