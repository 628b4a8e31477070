#pragma once

#include <string>
#include <string_view>

#include "interface/Values.h"

namespace orvanta::ctl {

// JSON has no dates and no data. In orvantactl's JSON {"$date": 1700000000.5} is a date (seconds since 1970) and
// {"$data": "AAEC"} is data (base64); both stand alone in their object.

// Parses one JSON document with those two forms.
Result<Value> parseTaggedJson(std::string_view text);
// One line of JSON with those two forms.
std::string writeTaggedJson(const Value& value, bool pretty = false);

// A user default on the command line. The value that a text stands for; `type` is string, int, float, bool or json.
Result<Value> parseDefaultsValue(const std::string& text, const std::string& type);
// As `defaults read KEY` shows it: a text as it is, anything else as JSON.
std::string showDefaultsValue(const Value& value);

}  // namespace orvanta::ctl
