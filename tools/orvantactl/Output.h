#pragma once

#include <string>

#include "interface/Reply.h"

namespace orvanta::ctl {

// The output and the exit status of orvantactl. Answers go to standard output, complaints to standard error.

// docs/client.md, the manual page and the help text list these.
enum ExitStatus : int {
  kAllTaken = 0,           // the daemon took everything
  kSomethingNotTaken = 1,  // an event, file or call was not taken, or there is no answer to show
  kUsage = 2,              // the command line or an option's value is invalid, or a file that it names cannot be read
  kNoService = 3,          // the daemon does not run, or it refused this user
  kOutputLost = 4,         // the daemon took everything, but standard output did not take all answers
};
ExitStatus exitStatusFor(const CallError& error);

// "orvantactl: TEXT" on standard error.
void complain(const std::string& text);
// The same for a call that failed. Returns the exit status that follows.
int complain(const CallError& error);

// One line on standard output, written at once; any thread. Returns false when standard output does not take it: main
// says so, by statusAfterOutput(), so callers check only where going on would be pointless.
bool printLine(const std::string& line);
// The exit status after the last output. If any was lost, however it was written, says so, and turns success into
// kOutputLost.
int statusAfterOutput(int status);

}  // namespace orvanta::ctl
