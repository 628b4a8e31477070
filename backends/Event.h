#pragma once

#include <cstdint>

#include "interface/Values.h"
#include "platform/core/Clock.h"

namespace orvanta {

// A client's request with an event. Clients may send any other number; it asks for nothing.
enum class EventFlag : std::int32_t {
  none = 0,
  realtime = 1,            // goes at once, past the batch
  promote = 2,             // a held backend reports from here on
  realtimeAndPromote = 3,  // both
};

constexpr bool isRealtime(EventFlag flag) {
  return flag == EventFlag::realtime || flag == EventFlag::realtimeAndPromote;
}
constexpr bool isPromoting(EventFlag flag) {
  return flag == EventFlag::promote || flag == EventFlag::realtimeAndPromote;
}

// One event on its way from a client to the backends. Cheap to copy: the payload is shared.
//
// `category` and `type` are what the backends' described operations and datagrams call `method` and `respCode`, and
// filters and the JSON of events `method` and `status`.
struct Event {
  SharedDictionary payload = nullptr;
  platform::TimeValue time = {};  // when the daemon took it
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  EventFlag flag = EventFlag::none;
  std::uint16_t number = 0;  // given by each backend to the events that it is sent: 1, 2, …, 65535, 0, 1, …
};

}  // namespace orvanta
