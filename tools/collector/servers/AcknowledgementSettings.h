#pragma once

#include <chrono>

#include "interface/Values.h"

namespace orvanta::collector {

// How the dashboard server acknowledges the datagrams that ask for it. Forged ones are sent besides the right one, lost
// or not.
struct AcknowledgementSettings {
  bool acknowledge = true;
  unsigned lossPercent = 0;  // of the right ones
  std::chrono::milliseconds delay{0};
  unsigned duplicates = 0;      // further copies of each right one
  unsigned unknownNumbers = 0;  // forged: event numbers that were never sent
  unsigned tooShort = 0;        // forged: the right bytes, cut before the event number
  unsigned foreign = 0;         // forged: the right number, from another port
};

// {"acknowledge", "lossPercent", "delayMs", "duplicates", "unknownNumbers", "tooShort", "foreign"}; absent keys as
// above. Unknown keys and wrong types are refused.
Result<AcknowledgementSettings> parseAcknowledgementSettings(const Value& value);
Dictionary describe(const AcknowledgementSettings& settings);

}  // namespace orvanta::collector
