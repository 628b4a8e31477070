#include "daemon/SessionRegistry.h"

#include <algorithm>

#include "interface/OrvantaLogging.h"

namespace orvanta {

namespace {

// The identifiers of ancestors given from the parent upwards; nullopt without ancestors.
std::optional<std::string> joinedRootFirst(const std::vector<std::shared_ptr<OrvantadSession>>& ancestors) {
  if (ancestors.empty()) return std::nullopt;
  std::string joined;
  for (auto ancestor = ancestors.rbegin(); ancestor != ancestors.rend(); ++ancestor) {
    if (!joined.empty()) joined += '.';
    joined += (*ancestor)->sessionIDString();
  }
  return joined;
}

}  // namespace

std::shared_ptr<OrvantadSession> SessionRegistry::getFirstSessionWithHierarchy(std::int64_t level, const Group& group) {
  const auto found = group.levels.find(level);
  return found == group.levels.end() ? nullptr : found->second.begin()->second;
}

const SessionRegistry::Group* SessionRegistry::groupOf(const OrvantadSession& session) const {
  const auto found = _correlatedSessions.find(*session.hierarchyToken());
  return found == _correlatedSessions.end() ? nullptr : &found->second;
}

bool SessionRegistry::holds(const Group& group, const OrvantadSession& session) const {
  const auto place = _places.find(&session);
  return place != _places.end() && place->second.group == &group;
}

void SessionRegistry::update(const std::shared_ptr<OrvantadSession>& session) {
  remove(*session);
  const auto& token = session->hierarchyToken();
  if (!token) return;
  Group& group = _correlatedSessions[*token];
  ORVANTA_LOG(debug, "updateCorrelatedSessions: Adding session {} to list for hierarchyToken {} with hierarchyLevel {}",
              session->sessionID(), *token, session->hierarchyLevel());
  const Place place{&group, session->hierarchyLevel(), _nextOrder++};
  group.levels[place.level].emplace(place.order, session);
  ++group.size;
  _places.emplace(session.get(), place);
}

void SessionRegistry::remove(const OrvantadSession& session) {
  const auto found = _places.find(&session);
  if (found == _places.end()) return;
  const Place& place = found->second;
  const auto level = place.group->levels.find(place.level);
  level->second.erase(place.order);
  if (level->second.empty()) place.group->levels.erase(level);
  --place.group->size;
  _places.erase(found);
}

std::shared_ptr<OrvantadSession> SessionRegistry::parentSessionForChild(const OrvantadSession& child) const {
  if (child.hierarchyLevel() == 0 || !child.hierarchyToken()) return nullptr;
  const std::string& token = *child.hierarchyToken();
  ORVANTA_LOG(debug, "parentSessionForChild: Checking hierarchyToken '{}' for session {}", token, child.sessionID());
  const Group* group = groupOf(child);
  if (group == nullptr || group->size == 0) {
    ORVANTA_LOG(error, "parentSessionForChild: ERROR: No sessions found for hierarchyToken {}", token);
    return nullptr;
  }
  if (!holds(*group, child)) {
    ORVANTA_LOG(error, "parentSessionForChild: ERROR: Session {} not found for hierarchyToken {}", child.sessionID(),
                token);
    return nullptr;
  }
  const std::int64_t level = static_cast<std::int64_t>(child.hierarchyLevel()) - 1;
  auto parent = getFirstSessionWithHierarchy(level, *group);
  if (!parent) {
    ORVANTA_LOG(error, "parentSessionForChild: Unable to find session with hierarchy of {} for hierarchyToken '{}'",
                level, token);
  }
  return parent;
}

std::optional<std::string> SessionRegistry::parentSessionIDStringForSession(const OrvantadSession& session) const {
  const std::string& token = *session.hierarchyToken();
  const Group* group = groupOf(session);
  if (group == nullptr || group->size == 0) {
    ORVANTA_LOG(error, "parentSessionIDStringForSession: ERROR: No sessions found for hierarchyToken {}", token);
    return std::nullopt;
  }
  if (!holds(*group, session)) {
    ORVANTA_LOG(info, "parentSessionIDStringForSession: Session {} not found for hierarchyToken {}",
                session.sessionID(), token);
    return std::nullopt;
  }
  // Joined at the end, lest a chain of a thousand levels be copied a thousand times.
  std::vector<std::shared_ptr<OrvantadSession>> ancestors;
  for (std::int64_t level = static_cast<std::int64_t>(session.hierarchyLevel()) - 1; level >= 0; --level) {
    auto ancestor = getFirstSessionWithHierarchy(level, *group);
    if (!ancestor) {
      ORVANTA_LOG(info,
                  "parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): incomplete "
                  "parentSessionID is '{}'",
                  joinedRootFirst(ancestors).value_or(""));
      break;
    }
    ancestors.push_back(std::move(ancestor));
  }
  return joinedRootFirst(ancestors);
}

std::shared_ptr<OrvantadSession> SessionRegistry::getAncestorWithAggregatorForSession(
    const OrvantadSession& session) const {
  if (!session.hasUserInfo()) {
    ORVANTA_LOG(info, "getAncestorWithAggregatorForSession: No user info found for session {}", session.sessionID());
    return nullptr;
  }
  if (!session.hierarchyToken() || session.hierarchyLevel() < 1) return nullptr;
  const Group* group = groupOf(session);
  if (group == nullptr) return nullptr;
  // Levels in ascending order: root first. Empty levels cost nothing.
  for (const auto& [level, sessions] : group->levels) {
    if (level >= static_cast<std::int64_t>(session.hierarchyLevel())) break;
    const auto& first = sessions.begin()->second;
    if (first->hasAggregator()) return first;
  }
  return nullptr;
}

std::vector<std::shared_ptr<OrvantadSession>> SessionRegistry::downstreamOf(const OrvantadSession& session) const {
  std::vector<std::pair<std::uint64_t, std::shared_ptr<OrvantadSession>>> found;
  if (const Group* group = session.hierarchyToken() ? groupOf(session) : nullptr) {
    const auto own = static_cast<std::int64_t>(session.hierarchyLevel());
    for (auto level = group->levels.upper_bound(own); level != group->levels.end(); ++level) {
      found.insert(found.end(), level->second.begin(), level->second.end());
    }
  }
  std::sort(found.begin(), found.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
  std::vector<std::shared_ptr<OrvantadSession>> sessions;
  sessions.reserve(found.size());
  for (auto& entry : found) sessions.push_back(std::move(entry.second));
  return sessions;
}

}  // namespace orvanta
