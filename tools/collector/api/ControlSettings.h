#pragma once

#include <string>

#include "interface/Values.h"
#include "tools/collector/servers/Behaviours.h"
#include "tools/collector/servers/DashboardServer.h"
#include "tools/collector/servers/StorebagServer.h"

namespace orvanta::collector {

// The settings of the /control URLs as JSON: parsed from what a client posts, described for GET /control. Pure.
//
// Parsing refuses unknown keys, wrong types and numbers out of range, so that a misspelt key does not silently leave
// the default in force; the failure names the key. A key that is absent leaves its field as the struct initializes it.

// {"path", "status", "body", "headers", "delayMs", "fault", "times"}
struct PathSetting {
  std::string path;
  PathBehaviour behaviour;
};
Result<PathSetting> parsePathSetting(const Value& value);
Dictionary describe(const PathBehaviour& behaviour);

// {"acknowledge", "lossPercent", "delayMs", "duplicates", "unknownNumbers", "tooShort", "foreign"}
Result<AcknowledgementSettings> parseAcknowledgementSettings(const Value& value);
Dictionary describe(const AcknowledgementSettings& settings);

// {"container", "bag", "lastModified", "maxAge"}; "maxAge" is a number of seconds, null or "refresh_cycle".
Result<StorebagSettings> parseStorebagSettings(const Value& value);
Dictionary describe(const StorebagSettings& settings);

}  // namespace orvanta::collector
