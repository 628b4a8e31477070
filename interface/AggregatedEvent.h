#pragma once

#include <cstdint>

#include "interface/Values.h"

namespace orvanta {

// What the daemon hands to an aggregating client: one event, or the notice that aggregation has ended.
struct AggregatedEvent {
  SharedDictionary sessionInfo;  // of the session where the event entered; null in the end notice
  double timestamp = 0;          // seconds since 1970
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  SharedDictionary payload;  // with the user info of the session where the event entered; null: none
  bool isEndNotice() const { return !sessionInfo && timestamp == 0 && category == 0 && type == 0 && !payload; }
};

}  // namespace orvanta
