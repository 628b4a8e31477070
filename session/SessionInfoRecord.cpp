#include "session/SessionInfoRecord.h"

#include <fmt/format.h>

#include "interface/WireLimits.h"

namespace orvanta {

std::optional<std::string> refusalOfHierarchy(const Dictionary& sessionInfo) {
  const auto position = HierarchyPosition::read(sessionInfo);
  if (!position.token || (position.level >= 0 && position.level <= kMaximumHierarchyLevel)) return std::nullopt;
  return fmt::format("hierarchy level {} is not between 0 and {}", position.level, kMaximumHierarchyLevel);
}

}  // namespace orvanta
