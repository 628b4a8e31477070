#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "backends/Event.h"
#include "config/DeviceInfo.h"
#include "interface/ClientSessionInterface.h"
#include "platform/ipc/Connection.h"
#include "session/Aggregation.h"
#include "session/BackendSet.h"
#include "session/DaemonServices.h"
#include "session/OrvantadSessionDelegate.h"
#include "session/SessionInfoRecord.h"

namespace orvanta {

// The daemon's side of one client connection: holds the session's description and its backends and carries out every
// call of the client.
//
// Owned by the agent's session list and by the connection's handler. Every operation runs on the session's queue, which
// is its connection's, one at a time, unless it says otherwise. end() is the last job there; after it the session can
// be dropped on any thread. Failures are logged and answered as the operations describe; nothing here throws.
class OrvantadSession final : public ClientSessionInterface, public std::enable_shared_from_this<OrvantadSession> {
 public:
  // `connection` may be null for a session without a client (tests): it is then sent nothing.
  static std::shared_ptr<OrvantadSession> create(DaemonServices& services, OrvantadSessionDelegate& delegate,
                                                 std::shared_ptr<platform::Connection> connection);
  ~OrvantadSession() override;

  // --- The client's calls ---
  void setSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo, SharedArray frameworksToCheck,
                      bool hasAggregationBlock, DoneReply done) override;
  void startConfigWithCompletionHandler(BackendNamesReply completion) override;
  void fetchStatesWithUserInfo(SharedDictionary userInfo, BackendNamesReply completion) override;
  void fetchDisplayURL(StringReply reply) override;
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                               StringReply reply) override;
  void sendMessageWithDictionary(SharedDictionary parameters, StringReply reply) override;
  void flushMessagesWithCompletion(FlushReply completion) override;
  void finishSessionWithReply(StringReply reply) override;
  void uploadFileAtPath(std::string fileURL, std::optional<std::string> extensionToken,
                        UploadReply completion) override;
  void uploadLogData(SharedArray logData, LogDataReply completion) override;
  void sendMessageWithSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo, std::uint16_t category,
                                  std::uint16_t type, SharedDictionary payload, StringReply reply) override;

  // Sends the session-end record, flushes, ends aggregation and cleans the backends up. Once, as the session's last
  // job.
  void end();

  // --- Called by related sessions' threads, which hold the agent's lock ---
  std::uint32_t sessionID() const { return _info.sessionID; }
  const std::string& sessionIDString() const { return _sessionIDString; }
  std::uint32_t hierarchyLevel() const { return static_cast<std::uint32_t>(_info.hierarchy.level); }
  const std::optional<std::string>& hierarchyToken() const { return _info.hierarchy.token; }
  bool hasUserInfo() const { return _userInfo != nullptr; }
  void updateCombinedSessionID();
  void syncReportingStates();
  // Any thread.
  bool hasAggregator() const { return _aggregation.hasAggregator(); }
  void shutdownSessionAggregation();
  // Returns whether this session's client was given the event: not when its aggregation has ended meanwhile. Any
  // thread.
  bool sendToAggregator(const SharedDictionary& sessionInfo, const Event& event) {
    return _aggregation.send(sessionInfo, event);
  }

  // --- The session's queue only ---
  const SharedDictionary& sessionInfo() const { return _sessionInfo; }
  const SharedDictionary& userInfo() const { return _userInfo; }
  const std::optional<std::string>& storebagVersion() const { return _storebagVersion; }
  std::int32_t clientType() const { return _info.clientType; }
  const BackendSet* backends() const { return _backends.get(); }
  // Returns whether the registry holds the session in a group; set by the agent.
  bool isInGroup() const { return _inGroup; }
  void setInGroup(bool inGroup) { _inGroup = inGroup; }
  // For log lines.
  std::string description() const;
  const std::shared_ptr<platform::Connection>& connection() const { return _connection; }

 private:
  OrvantadSession(DaemonServices& services, OrvantadSessionDelegate& delegate,
                  std::shared_ptr<platform::Connection> connection);

  // Setup.
  void configure(SharedDictionary sessionInfo, SessionInfoRecord info);
  void createBackendsWithStorebag(const SharedDictionary& storebag);
  void replaceBackends(std::unique_ptr<BackendSet> backends);  // cleans the earlier ones up
  void sendStartMessage();
  void receivedUserInfo(SharedDictionary userInfo);
  void updateSessionWithDefaultSessionInfo();
  BackendNames fetchReportingStates() const;
  // Held around changes of what related sessions read. Sessions outside every group take no lock.
  std::unique_lock<AgentLock> lockSharedFields(bool joiningGroup = false);

  // Events.
  std::optional<std::string> send(std::uint16_t category, std::uint16_t type, SharedDictionary payload);
  std::optional<std::string> dispatch(Event event);
  void internalSendMessage(SharedDictionary payload, std::uint16_t category, std::uint16_t type);
  void sendSingleMessage(const SharedDictionary& userInfo, const SharedDictionary& storebag, Event event) const;
  void aggregateMessage(Event event);

  // Constant after construction.
  DaemonServices& _services;
  Platform& _platform;
  OrvantadSessionDelegate& _delegate;
  const std::shared_ptr<platform::Connection> _connection;  // null for a session without a client
  DeviceIDBuffer _deviceid{};
  std::string _sessionIDString;

  // Written on the session's queue, under the agent's lock when the session is in a group; read there without it, and
  // by related sessions' threads under it.
  SessionInfoRecord _info;
  SharedDictionary _userInfo;
  std::unique_ptr<BackendSet> _backends;  // null until there is a storebag

  // The session's queue only.
  SharedDictionary _sessionInfo;  // null until configured
  SharedArray _frameworks;
  std::optional<std::string> _storebagVersion;
  bool _inGroup = false;
  bool _ended = false;

  // Any thread.
  Aggregation _aggregation;
};

}  // namespace orvanta
