#pragma once

namespace platform {

// The process's own set-up. All of it is for main's thread, before other threads exist.

// Gives way to interactive work: a background service's scheduling, inherited by every later thread.
void enterUtilitySchedulingClass();
// SIGTERM and SIGINT no longer interrupt anything, SIGPIPE never ends the process; inherited by every later thread.
void blockTerminationSignals();
// Sleeps until SIGTERM or SIGINT; returns its number.
int waitForTermination();

}  // namespace platform
