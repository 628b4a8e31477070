#pragma once

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <mutex>
#include <optional>
#include <string>

#include "client/ClientSession.h"
#include "client/Records.h"
#include "tools/orvantactl/OrderedLines.h"

namespace orvanta::ctl {

// Sends events without waiting for each answer, at most `window` unanswered at a time, and writes the answers as lines
// of JSON in the order of the events.
//
// Owned by the command, on whose thread it is used; answers come on the library's thread. Lives until drain() has
// returned.
class EventPipeline {
 public:
  // `out` is null when answers are not wanted; errors are then counted all the same.
  EventPipeline(ClientSession& session, std::size_t window, std::FILE* out)
      : _session(session), _window(window), _out(out) {}

  // Waits for a place. `line` is the event's number in the answer.
  void send(std::uint64_t line, const MessageParameters& event);
  // Waits until everything has been answered and written.
  void drain();

  // Whether a call has failed because the connection is gone: then more events are pointless.
  bool lost() const;
  std::uint64_t failures() const;
  // The first one.
  std::optional<CallError> firstError() const;

 private:
  void answered(std::uint64_t place, std::uint64_t line, StringReply::Outcome outcome);

  ClientSession& _session;
  const std::size_t _window;
  std::FILE* const _out;

  mutable std::mutex _mutex;
  std::condition_variable _moved;
  OrderedLines _lines;                   // guarded by _mutex
  std::uint64_t _failures = 0;           // guarded by _mutex
  std::optional<CallError> _firstError;  // guarded by _mutex
  bool _lost = false;                    // guarded by _mutex
};

// {"event": line, "reply": …}, or with "error" in its place.
std::string answerLine(std::uint64_t line, const StringReply::Outcome& outcome);

}  // namespace orvanta::ctl
