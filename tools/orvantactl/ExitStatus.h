#pragma once

#include "interface/Reply.h"

namespace orvanta::ctl {

// What orvantactl's exit status says; docs/client.md and the help text list them.
enum ExitStatus : int {
  kAllTaken = 0,           // the daemon took everything
  kSomethingNotTaken = 1,  // an event, file or call was not taken, or there is no answer to show
  kUsage = 2,              // the command line or an option's value makes no sense
  kNoService = 3,          // no daemon there, or it turned this user away
  kOutputLost = 4,         // the daemon took everything, but standard output did not take all answers
};

inline ExitStatus exitStatusFor(const CallError& error) {
  return error.kind == CallErrorKind::noSuchService || error.kind == CallErrorKind::notEntitled ? kNoService
                                                                                                : kSomethingNotTaken;
}

}  // namespace orvanta::ctl
