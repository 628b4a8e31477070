#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <deque>
#include <optional>
#include <string>
#include <utility>

#include "client/ClientSession.h"
#include "client/Records.h"
#include "platform/core/Mutex.h"

namespace orvanta::ctl {

// Lines that become ready in any order and come out in the order in which their places were reserved. Not thread-safe.
class OrderedLines {
 public:
  // Returns the next place.
  std::uint64_t reserve() {
    _places.emplace_back();
    return _first + _places.size() - 1;
  }
  void fill(std::uint64_t place, std::string line) { _places[place - _first] = std::move(line); }
  // The next line in order; nullopt while it is not ready.
  std::optional<std::string> take() {
    if (_places.empty() || !_places.front()) return std::nullopt;
    auto line = std::move(_places.front());
    _places.pop_front();
    ++_first;
    return line;
  }
  // Places reserved whose lines have not come out.
  std::size_t size() const { return _places.size(); }

 private:
  std::deque<std::optional<std::string>> _places;
  std::uint64_t _first = 0;  // the place of _places.front()
};

// Sends events without waiting for each answer, at most `window` unanswered at a time, and writes the answers as lines
// of JSON in the order of the events.
//
// Owned by the command and used on its thread; answers come on the library's thread. Must live until drain() has
// returned. A failed call is counted, written in place of its answer, and does not stop the others.
class EventPipeline {
 public:
  // With a null `out` answers are not written; failures are counted all the same.
  EventPipeline(ClientSession& session, std::size_t window, std::FILE* out)
      : _session(session), _window(window), _out(out) {}

  // Waits while the window is full. `line` is the event's number in the answer.
  void send(std::uint64_t line, const MessageParameters& event);
  // Waits until everything has been answered and written.
  void drain();

  // Returns whether a call has failed because the connection has ended: then sending more events is pointless.
  bool lost() const;
  std::uint64_t failures() const;
  std::optional<CallError> firstError() const;

 private:
  void answered(std::uint64_t place, std::uint64_t line, StringReply::Outcome outcome);

  ClientSession& _session;
  const std::size_t _window;
  std::FILE* const _out;

  mutable platform::Mutex _mutex;
  platform::Condition _moved;  // half the window is free, or all of it
  OrderedLines _lines GUARDED_BY(_mutex);
  std::uint64_t _failures GUARDED_BY(_mutex) = 0;
  std::optional<CallError> _firstError GUARDED_BY(_mutex);
  bool _lost GUARDED_BY(_mutex) = false;
};

}  // namespace orvanta::ctl
