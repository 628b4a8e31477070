#pragma once

namespace orvanta::platform {

// The process's own set-up. All of it is for main's thread, before other threads exist, unless it says otherwise.

// Opens /dev/null in place of standard input, output or error where it is closed: a socket or file that got its number
// would be printed to, or read as input. Before anything is opened.
void secureStandardDescriptors();
// Gives way to interactive work: a background service's scheduling, inherited by every later thread.
void enterUtilitySchedulingClass();
// SIGTERM and SIGINT no longer interrupt anything, SIGPIPE never ends the process; inherited by every later thread.
void blockTerminationSignals();
// Sleeps until SIGTERM or SIGINT; returns its number.
int waitForTermination();

// Has the allocator keep what bursts of work free and take again, instead of returning it to the kernel each time: the
// daemon is idle most of its life.
void tuneAllocator();

// Gives the kernel back memory that is not in use: freed heap, and the pages of programs and libraries that start-up or
// earlier work touched; those that are needed again come from the page cache. Takes about a millisecond. Any thread.
void releaseUnusedMemory();

}  // namespace orvanta::platform
