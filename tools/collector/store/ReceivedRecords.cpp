#include "tools/collector/store/ReceivedRecords.h"

#include <algorithm>
#include <array>
#include <utility>

namespace orvanta::collector {

namespace {

constexpr std::array<std::pair<RequestKind, std::string_view>, 5> kKindTexts{{{RequestKind::storebag, "storebag"},
                                                                              {RequestKind::events, "events"},
                                                                              {RequestKind::logData, "logdata"},
                                                                              {RequestKind::upload, "upload"},
                                                                              {RequestKind::other, "other"}}};

}  // namespace

std::string_view requestKindText(RequestKind kind) {
  return std::find_if(kKindTexts.begin(), kKindTexts.end(), [&](const auto& row) { return row.first == kind; })->second;
}

std::optional<RequestKind> requestKindFromText(std::string_view text) {
  const auto* const row =
      std::find_if(kKindTexts.begin(), kKindTexts.end(), [&](const auto& entry) { return entry.second == text; });
  if (row == kKindTexts.end()) return std::nullopt;
  return row->first;
}

std::optional<std::string> ReceivedRequest::parameter(std::string_view name) const {
  return queryParameter(target, name);
}

}  // namespace orvanta::collector
