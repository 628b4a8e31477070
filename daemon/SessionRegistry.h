#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "session/OrvantadSession.h"

namespace orvanta {

// The groups of related sessions: for each hierarchy token the sessions registered under it, in order of registration.
//
// Owned by the agent and used under its lock, since sessions of all connections come here. A question without an answer
// yields null or nullopt and a log line; nothing is created or repaired.
class SessionRegistry {
 public:
  // Moves the session to the end of its token's group, from the group that held it before; one without a token leaves.
  void update(const std::shared_ptr<OrvantadSession>& session);
  // Takes the session out of its group; the group stays, even when empty.
  void remove(const OrvantadSession& session);

  std::shared_ptr<OrvantadSession> parentSessionForChild(const OrvantadSession& child) const;
  std::optional<std::string> parentSessionIDStringForSession(const OrvantadSession& session) const;
  std::shared_ptr<OrvantadSession> getAncestorWithAggregatorForSession(const OrvantadSession& session) const;
  // The sessions of the group that are deeper than this one, in order of registration.
  std::vector<std::shared_ptr<OrvantadSession>> downstreamOf(const OrvantadSession& session) const;

  // Of tokens ever registered, those of empty groups included.
  std::size_t tokenCount() const { return _correlatedSessions.size(); }

 private:
  // Sessions by level, then by order of registration: "the first session of a level" is one look-up, however large the
  // group is. A level that has become empty is erased.
  using Level = std::map<std::uint64_t, std::shared_ptr<OrvantadSession>>;
  struct Group {
    std::map<std::int64_t, Level> levels;
    std::size_t size = 0;
  };
  struct Place {
    Group* group;
    std::int64_t level;
    std::uint64_t order;
  };

  // Of the session's token, whether or not the session is in it; null for one that was never registered.
  const Group* groupOf(const OrvantadSession& session) const;
  bool holds(const Group& group, const OrvantadSession& session) const;
  static std::shared_ptr<OrvantadSession> getFirstSessionWithHierarchy(std::int64_t level, const Group& group);

  std::unordered_map<std::string, Group> _correlatedSessions;  // groups are never erased: places point at them
  std::unordered_map<const OrvantadSession*, Place> _places;
  std::uint64_t _nextOrder = 0;
};

}  // namespace orvanta
