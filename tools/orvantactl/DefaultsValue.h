#pragma once

#include <string>

#include "platform/core/Result.h"
#include "platform/core/Value.h"

namespace orvanta::ctl {

// The value that a text on the command line stands for; `type` is string, int, float, bool or json.
platform::Result<platform::Value> parseDefaultsValue(const std::string& text, const std::string& type);
// As `defaults read KEY` shows it: a text as it is, anything else as JSON.
std::string showDefaultsValue(const platform::Value& value);

}  // namespace orvanta::ctl
