#pragma once

#include "bench/Measure.h"

namespace orvanta::bench {

// The least that each stage can cost, in CPU microseconds per event, measured in this run. The whole path is compared
// with their sum.
struct RawLimits {
  double decode = 0;
  double encode = 0;
  double gzip = 0;        // one of 50 records in a body
  double gzipSingle = 0;  // a body of one record
  double post = 0;        // one post
};

// Each runs its measurements and prints their lines.
RawLimits benchStages();
void benchCallPath();
void benchDashboard();
void benchWholePath(const RawLimits& limits);
// How events per second grow with processors, and how the cost of a session grows with its group.
void benchSessions();
// Returns the CPU microseconds of the system calls that a message-log line needs: listing, statx, open, write, close.
double benchMessageLog();

}  // namespace orvanta::bench
