#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "client/BlockingCalls.h"
#include "interface/ClientSessionInterface.h"

namespace orvanta::ctl {

// The lines of JSON that orvantactl writes, without their ends.

// {"event":LINE,"reply":…}, or with "error" in place of the reply. `line` is the event's number.
std::string answerLine(std::uint64_t line, const StringReply::Outcome& outcome);

// {"flush":{"result":…,"error":null}}, with an error as {"code":…,"description":…}.
std::string flushLine(const FlushAnswer& answer);
// The problem that the last flush had; nullopt when it succeeded. That there was nothing to flush is fine: unbatched
// events went out one by one, and the storebag means filtered ones to stay.
std::optional<std::string> flushProblem(const FlushAnswer& answer);

// Of `orvantactl watch`.
std::string watchingLine(const std::string& token, std::uint32_t level);
std::string aggregatedEventLine(const AggregatedEvent& event);

// A text, or null.
std::string optionalJson(const std::optional<std::string>& text);

}  // namespace orvanta::ctl
