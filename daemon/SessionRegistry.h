#pragma once

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "session/OrvantadSession.h"

namespace orvanta {

// Which sessions belong together: for each hierarchy token the sessions registered under it, in order of registration.
//
// Owned by the agent; every operation but tokenCount() needs the agent's lock, since sessions of all connections come
// here. A question without an answer yields none and a log line; nothing is created or repaired.
class SessionRegistry {
 public:
  // Puts the session at the end of its token's group, out of whatever group held it before.
  void update(const std::shared_ptr<OrvantadSession>& session);
  // Takes the session out of its group; the group stays, even when empty.
  void remove(const OrvantadSession& session);

  std::shared_ptr<OrvantadSession> parentSessionForChild(const OrvantadSession& child) const;
  std::optional<std::string> parentSessionIDStringForSession(const OrvantadSession& session) const;
  std::shared_ptr<OrvantadSession> getAncestorWithAggregatorForSession(const OrvantadSession& session) const;
  // The sessions of the group that are deeper than this one, in order of registration.
  std::vector<std::shared_ptr<OrvantadSession>> downstreamOf(const OrvantadSession& session) const;

  // Tokens ever registered. Any thread, no lock.
  std::size_t tokenCount() const { return _tokenCount.load(std::memory_order_relaxed); }

 private:
  // Sessions by level, then by order of registration: "the first session of a level" is one look-up however large the
  // group is.
  using Level = std::map<std::uint64_t, std::shared_ptr<OrvantadSession>>;
  struct Group {
    std::map<std::int64_t, Level> levels;
    std::size_t size = 0;
  };
  struct Place {
    std::string token;
    std::int64_t level;
    std::uint64_t order;
  };

  const Group* groupOf(const OrvantadSession& session) const;  // null: no such token
  bool holds(const Group& group, const OrvantadSession& session) const;
  static std::shared_ptr<OrvantadSession> getFirstSessionWithHierarchy(std::int64_t level, const Group& group);

  std::unordered_map<std::string, Group> _correlatedSessions;
  std::unordered_map<const OrvantadSession*, Place> _places;
  std::uint64_t _nextOrder = 0;
  std::atomic<std::size_t> _tokenCount{0};
};

}  // namespace orvanta
