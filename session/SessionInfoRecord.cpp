#include "session/SessionInfoRecord.h"

#include <fmt/format.h>

#include "interface/WireLimits.h"

namespace orvanta {

std::optional<std::string> refusalOfHierarchy(const Dictionary& sessionInfo) {
  const auto position = HierarchyPosition::read(sessionInfo);
  constexpr auto kMaximum = static_cast<std::int64_t>(kMaximumHierarchyLevel);
  if (!position.token || (position.level >= 0 && position.level <= kMaximum)) return std::nullopt;
  return fmt::format("hierarchy level {} is not between 0 and {}", position.level, kMaximum);
}

}  // namespace orvanta
