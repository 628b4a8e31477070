#pragma once

#include <optional>
#include <string>

#include "client/BlockingCalls.h"

namespace orvanta::ctl {

// {"flush":{"result":…,"error":null}}, with an error as {"code":…,"description":…}.
std::string flushLine(const FlushAnswer& answer);

// What was not taken, judged by the answer to the last flush; none when nothing is amiss. That there was nothing to
// flush is fine: unbatched events went out one by one, and what the storebag filters out is meant to stay.
std::optional<std::string> flushProblem(const FlushAnswer& answer);

}  // namespace orvanta::ctl
