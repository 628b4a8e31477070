#pragma once

#include <memory>

#include "bench/RawPeers.h"
#include "interface/Values.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/TemporaryDirectory.h"
#include "tools/collector/Collector.h"

namespace orvanta::bench {

// A real daemon that logs only warnings, with its storebag's section from a collector. Construction throws if one of
// the two does not start; destroying it ends both.
class BenchDaemon {
 public:
  // Without a section there is no collector, and no session has a backend. `consent`: the user allows diagnostics.
  explicit BenchDaemon(Dictionary section = {}, bool consent = true, bool sandbox = true);
  test::DaemonProcess& process() const { return *_process; }

 private:
  test::TemporaryDirectory _directory;
  std::unique_ptr<collector::Collector> _collector;
  std::unique_ptr<test::DaemonProcess> _process;
};

// A section with which sessions post to `sink` even without the user's consent, in batches of fifty if they ask for it.
Dictionary batchingSection(const PostSink& sink);

}  // namespace orvanta::bench
