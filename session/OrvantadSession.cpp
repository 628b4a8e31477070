#include "session/OrvantadSession.h"

#include <fmt/format.h>

#include "interface/OrvantaLogging.h"
#include "platform/codec/PropertyList.h"
#include "platform/host/Digest.h"

namespace orvanta {

std::shared_ptr<OrvantadSession> OrvantadSession::create(DaemonServices& services, OrvantadSessionDelegate& delegate,
                                                         std::shared_ptr<platform::Connection> connection) {
  return std::shared_ptr<OrvantadSession>(new OrvantadSession(services, delegate, std::move(connection)));
}

OrvantadSession::OrvantadSession(DaemonServices& services, OrvantadSessionDelegate& delegate,
                                 std::shared_ptr<platform::Connection> connection)
    : _services(services),
      _platform(services.platform),
      _delegate(delegate),
      _connection(std::move(connection)),
      _client(_connection ? std::make_unique<ClientReplyProxy>(_connection->outbox()) : nullptr) {
  ORVANTA_LOG(debug, "initWithSessionDelegate: OrvantadSession initWithSessionDelegate:<OrvantadAgent: {}>",
              static_cast<const void*>(&_delegate));
  copyUniqueDeviceID(_platform, _deviceid);
  _sessionIDString = platform::encodeBase64(platform::randomUuid());
  ORVANTA_LOG(debug, "initWithSessionDelegate: Initialized session with UUID {}", _sessionIDString);
}

OrvantadSession::~OrvantadSession() {
  if (!_ended) ORVANTA_LOG(error, "dealloc: OrvantadSession {} was dropped before it ended", _sessionIDString);
}

std::string OrvantadSession::description() const {
  return fmt::format("<OrvantadSession: {} {}>", _sessionIDString,
                     _connection ? _connection->description() : "without connection");
}

std::unique_lock<AgentLock> OrvantadSession::lockSharedFields(bool joiningGroup) {
  if (joiningGroup || _inGroup) return std::unique_lock(_delegate.lock());
  return {};
}

void OrvantadSession::end() {
  if (_ended) return;
  ORVANTA_LOG(debug, "dealloc: OrvantadSession dealloc: {}", _sessionID);

  auto payload = std::make_shared<Dictionary>();
  if (_storebagVersion) payload->set("StorebagVersion", *_storebagVersion);
  internalSendMessage(std::move(payload), 0, 1);
  flushMessagesWithCompletion({});
  shutdownSessionAggregation();
  if (_backends) {
    for (const auto& [key, backend] : *_backends) backend->cleanup();
  }
  _ended = true;

  // Owners are moved out first, so that whatever their destruction does happens outside the lock.
  std::optional<BackendSet> backends;
  SharedDictionary userInfo;
  {
    const auto lock = lockSharedFields();
    backends.swap(_backends);
    userInfo.swap(_userInfo);
  }
}

}  // namespace orvanta
