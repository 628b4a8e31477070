#pragma once

#include <string_view>

#include "client/Records.h"
#include "interface/Values.h"

namespace orvanta::ctl {

// Set by options for all events; a line's own "realtime" and "promote" decide for that line.
struct EventDefaults {
  bool realtime = false;
  bool promote = false;
};

// One event from a line of JSON: {"category": 1, "type": 2, "payload": {…}, "flag": 1, "realtime": true, "promote":
// true}, of which category and type are required. Fails for an unknown key, too; the failure names the key.
Result<MessageParameters> parseEventLine(std::string_view line, const EventDefaults& defaults);

}  // namespace orvanta::ctl
