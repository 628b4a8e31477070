#pragma once

#include <span>
#include <string>
#include <string_view>

#include "platform/core/Value.h"

namespace orvanta::platform {

// The one of `known` (at least one) that takes the fewest changes to become `word`: what was probably meant.
std::string_view nearestWord(std::string_view word, std::span<const std::string_view> known);

// The keys of `dictionary` that are not among `known`, as `unknown key "acess", did you mean "access"?`; empty when all
// are known.
std::string describeUnknownKeys(const Dictionary& dictionary, std::span<const std::string_view> known);

}  // namespace orvanta::platform
