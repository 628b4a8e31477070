#pragma once

namespace orvanta::platform {

// What the process keeps in memory, for a daemon that is idle most of its life.

// Has the allocator keep what bursts of work free and take again, instead of handing it back to the kernel each time.
// Before other threads exist.
void tuneAllocator();

// Hands back what is in memory but not in use: freed heap, and the pages of programs and libraries that start-up or
// earlier work touched; those that are needed again come from the page cache. Takes about a millisecond. Any thread.
void releaseUnusedMemory();

}  // namespace orvanta::platform
