#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/Event.h"
#include "backends/OrvantaBackend.h"
#include "config/DeviceInfo.h"
#include "interface/ClientSessionInterface.h"
#include "session/BackendFactory.h"
#include "session/DaemonServices.h"
#include "session/SessionInfoRecord.h"

namespace orvanta {

// The backends of a session, or of a one-off event, in the order of their names in the storebag, and the operations
// that concern all of them.
//
// Owned by its session and used on the session's queue. Threads of related sessions call the operations that say so,
// holding the agent's lock; the session replaces the set under it. Backends that fail do so by themselves: the others
// go on.
class BackendSet {
 public:
  struct Entry {
    std::shared_ptr<OrvantaBackend> backend;
    BackendRules rules;
  };

  // Makes a backend of each entry of the storebag and fills it with the session's and the device's facts. Returns null,
  // with a log line, without a storebag or session info; entries that yield no backend are skipped.
  static std::unique_ptr<BackendSet> create(DaemonServices& services, const SharedDictionary& storebag,
                                            const SessionInfoRecord* info, const SharedDictionary& userInfo,
                                            const DeviceIDBuffer& deviceID);

  bool empty() const { return _entries.empty(); }
  auto begin() const { return _entries.begin(); }
  auto end() const { return _entries.end(); }
  // Returns null when no backend has the name. Also under the agent's lock.
  OrvantaBackend* find(std::string_view name) const;

  // --- Events ---

  // Offers the event to every backend; returns the text that becomes the client's reply.
  std::optional<std::string> dispatch(Event event) const;
  // The same for a set that was made for this one event: evaluates each backend first, and needs no reply.
  void dispatchSingle(Event event) const;
  // The set is not empty. Keeps neither it nor the session alive.
  void flush(FlushReply completion) const;
  // Return whether any backend took it; all are asked.
  bool uploadFileAtPath(const OrvantaBackend::UploadFile& file) const;
  bool uploadLogData(const SharedArray& logData) const;
  void cleanup() const;

  // --- State ---

  void updateStates() const;
  void setUserInfo(const SharedDictionary& userInfo) const;
  // The session's own identifier, at first.
  void setCombinedSessionIDString(const std::string& sessionIDString) const;
  // The ancestors' and its own; batched records are relabelled. Also under the agent's lock.
  void setCorrelatedSessionID(const std::string& combined) const;
  // Takes the states and thresholds of the parent session's backends; null: it has no backends. Also under the agent's
  // lock.
  void followParent(const BackendSet* parent) const;
  // The names of those that report, or hold what they would report.
  std::vector<std::string> reportingNames() const;
  std::optional<std::string> displayURL() const;

 private:
  explicit BackendSet(DaemonServices& services) : _services(services) {}

  std::optional<std::string> offer(OrvantaBackend& backend, Event& event, std::string_view operation) const;

  // Constant once created.
  DaemonServices& _services;
  std::vector<Entry> _entries;
};

}  // namespace orvanta
