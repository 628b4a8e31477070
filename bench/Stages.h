#pragma once

#include "bench/Measure.h"

namespace orvanta::bench {

// CPU microseconds per event of the least that each stage can do, measured in this run; the whole path is held against
// their sum.
struct RawLimits {
  double decode = 0;
  double encode = 0;
  double gzip = 0;        // one of 50 records in a body
  double gzipSingle = 0;  // a body of one record
  double post = 0;        // one post
};

// Each prints its lines.
RawLimits benchStages();
void benchCallPath();
void benchDashboard();
void benchWholePath(const RawLimits& limits);
// How events per second grow with processors, and what a large group of related sessions costs each of them.
void benchSessions();
// CPU microseconds of the system calls that a message-log line takes at least: listing, statx, open, write, close.
double benchMessageLog();

}  // namespace orvanta::bench
