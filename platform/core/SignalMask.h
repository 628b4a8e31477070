#pragma once

#include <pthread.h>

#include <csignal>

namespace orvanta::platform {

// Blocks all signals for the calling thread, and gives it its mask back at the end of the block. Threads inherit the
// mask: ones that are started meanwhile take no signals, which belong to the main thread (or, in a client, to a program
// that knows nothing of us).
class AllSignalsBlocked {
 public:
  AllSignalsBlocked() {
    sigset_t all;
    ::sigfillset(&all);
    ::pthread_sigmask(SIG_SETMASK, &all, &_before);
  }
  ~AllSignalsBlocked() { ::pthread_sigmask(SIG_SETMASK, &_before, nullptr); }
  AllSignalsBlocked(const AllSignalsBlocked&) = delete;
  AllSignalsBlocked& operator=(const AllSignalsBlocked&) = delete;

 private:
  sigset_t _before{};
};

}  // namespace orvanta::platform
