#pragma once

#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "backends/https/EventRecord.h"

namespace orvanta {

// One event of a message, with what is laid over it. Borrows.
struct OutgoingEvent {
  const EventRecord* record = nullptr;
  EventRecord::Overlay overlay;
};

// The body of one post: {"postTime", "clientId", "events"} as compact JSON, and, when asked for, the same indented for
// people to read.
struct PostMessage {
  std::string json;
  std::optional<std::string> prettyJsonString;
};

// `postTime` in seconds since 1970. Values that can never be sent are logged and left out; everything else goes.
PostMessage createMessageForPostAndLogging(double postTime, std::string_view clientID,
                                           std::span<const OutgoingEvent> events, bool pretty);

}  // namespace orvanta
