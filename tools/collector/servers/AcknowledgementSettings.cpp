#include "tools/collector/servers/AcknowledgementSettings.h"

#include <utility>

#include "tools/collector/servers/SettingsReader.h"

namespace orvanta::collector {

namespace {

constexpr std::int64_t kMostCopies = 1000;
constexpr std::int64_t kLongestDelayMs = 600'000;

}  // namespace

Result<AcknowledgementSettings> parseAcknowledgementSettings(const Value& value) {
  SettingsReader reader(value);
  AcknowledgementSettings settings;
  settings.acknowledge = reader.boolean("acknowledge").value_or(true);
  settings.lossPercent = static_cast<unsigned>(reader.integer("lossPercent", 0, 100).value_or(0));
  settings.delay = std::chrono::milliseconds(reader.integer("delayMs", 0, kLongestDelayMs).value_or(0));
  settings.duplicates = static_cast<unsigned>(reader.integer("duplicates", 0, kMostCopies).value_or(0));
  settings.unknownNumbers = static_cast<unsigned>(reader.integer("unknownNumbers", 0, kMostCopies).value_or(0));
  settings.tooShort = static_cast<unsigned>(reader.integer("tooShort", 0, kMostCopies).value_or(0));
  settings.foreign = static_cast<unsigned>(reader.integer("foreign", 0, kMostCopies).value_or(0));
  if (auto failure = reader.finish()) return std::move(*failure);
  return settings;
}

Dictionary describe(const AcknowledgementSettings& settings) {
  return Dictionary{{"acknowledge", settings.acknowledge},
                    {"lossPercent", settings.lossPercent},
                    {"delayMs", static_cast<std::int64_t>(settings.delay.count())},
                    {"duplicates", settings.duplicates},
                    {"unknownNumbers", settings.unknownNumbers},
                    {"tooShort", settings.tooShort},
                    {"foreign", settings.foreign}};
}

}  // namespace orvanta::collector
