#include "backends/https/EventBatch.h"

#include <utility>

namespace orvanta {

std::int32_t EventBatch::countOf(std::int32_t category) const {
  const auto found = _eventMethodCounts.find(category);
  return found == _eventMethodCounts.end() ? 0 : found->second;
}

void EventBatch::append(EventRecord record, std::size_t footprint, std::int32_t countBefore, std::uint64_t labelsSeen) {
  const std::int32_t category = record.category();
  _events.records.push_back(std::move(record));
  _footprint += footprint;
  _eventMethodCounts[category] = countBefore + 1;
  if (labelsSeen != _labels) {
    // All before it were relabelled with it: events are made one at a time.
    _events.sessionID = _lastLabel;
    _events.relabelledCount = _events.records.size();
  }
}

EventBatch::Events EventBatch::take() {
  _footprint = 0;
  return std::exchange(_events, {});
}

void EventBatch::relabel(const std::optional<std::string>& sessionID) {
  ++_labels;
  _lastLabel = sessionID;
  if (!exists()) return;
  _events.sessionID = sessionID;
  _events.relabelledCount = _events.records.size();
}

}  // namespace orvanta
