#include "tools/orvantactl/Output.h"

#include <fmt/format.h>

#include <atomic>
#include <cerrno>
#include <cstdio>

#include "platform/core/Text.h"

namespace orvanta::ctl {

namespace {
// The errno of the first line that was not taken; the stream remembers a failure, but not its reason. Lines come from
// the library's thread, too.
std::atomic<int> gOutputError{0};
}  // namespace

ExitStatus exitStatusFor(const CallError& error) {
  const bool unavailable = error.kind == CallErrorKind::noSuchService || error.kind == CallErrorKind::notEntitled;
  return unavailable ? kNoService : kSomethingNotTaken;
}

void complain(const std::string& text) {
  // fwrite does not throw: a closed standard error must not abort the program.
  const auto line = fmt::format("orvantactl: {}\n", text);
  std::fwrite(line.data(), 1, line.size(), stderr);
}

int complain(const CallError& error) {
  complain(error.text);
  return exitStatusFor(error);
}

bool printLine(const std::string& line) {
  std::fwrite(line.data(), 1, line.size(), stdout);
  std::fputc('\n', stdout);
  if (std::fflush(stdout) == 0 && std::ferror(stdout) == 0) return true;
  int unset = 0;
  gOutputError.compare_exchange_strong(unset, errno);
  return false;
}

int statusAfterOutput(int status) {
  if (std::fflush(stdout) == 0 && std::ferror(stdout) == 0) return status;
  const int code = gOutputError != 0 ? gOutputError.load() : errno;
  complain(fmt::format("standard output did not take everything: {}", platform::errnoText(code)));
  return status == kAllTaken ? kOutputLost : status;
}

}  // namespace orvanta::ctl
