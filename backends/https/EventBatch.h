#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "backends/https/EventRecord.h"

namespace orvanta {

// The prepared events that wait for a flush, oldest first, and how many of each category were batched since the last
// flush that sent. Owned by an HTTPSPostBackend and guarded by its mutex; what is taken out belongs to the taker.
class EventBatch {
 public:
  // Waiting events, and the identifier that the first `relabelledCount` of them report instead of their own (nullopt:
  // they report none).
  struct Events {
    std::vector<EventRecord> records;
    std::size_t relabelledCount = 0;
    std::optional<std::string> sessionID;

    EventRecord::Overlay overlayFor(std::size_t index) const {
      return {index < relabelledCount, sessionID ? &*sessionID : nullptr, nullptr};
    }
  };

  bool exists() const { return !_events.records.empty(); }
  std::int32_t countOf(std::int32_t category) const;
  // About how much memory the waiting events keep alive.
  std::size_t footprint() const { return _footprint; }
  // Grows with every relabel().
  std::uint64_t labels() const { return _labels; }

  // `countBefore`: what the event's category is taken to have counted so far. `labelsSeen`: labels() when the
  // identifier in the record was read; a relabelling since then reaches the record too.
  void append(EventRecord record, std::size_t footprint, std::int32_t countBefore, std::uint64_t labelsSeen);
  // Takes out all events; the counts stay.
  Events take();
  void clearCounts() { _eventMethodCounts.clear(); }
  // From now on the waiting events report this identifier.
  void relabel(const std::optional<std::string>& sessionID);

 private:
  Events _events;
  std::size_t _footprint = 0;
  std::uint64_t _labels = 0;
  std::optional<std::string> _lastLabel;
  std::unordered_map<std::int32_t, std::int32_t> _eventMethodCounts;
};

}  // namespace orvanta
