#pragma once

#include <string>

#include "interface/Values.h"

namespace orvanta::ctl {

// The value that a text on the command line stands for; `type` is string, int, float, bool or json.
Result<Value> parseDefaultsValue(const std::string& text, const std::string& type);
// As `defaults read KEY` shows it: a text as it is, anything else as JSON.
std::string showDefaultsValue(const Value& value);

}  // namespace orvanta::ctl
