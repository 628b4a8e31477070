#include "config/Conversions.h"
#include "interface/OrvantaLogging.h"
#include "session/FlushRequest.h"
#include "session/OrvantadSession.h"

// Handing events back to the client that asked for those of its hierarchy, and flushing.

namespace orvanta {

void OrvantadSession::aggregateMessage(const Event& event) {
  if (!_userInfo) {
    // Nobody needs the lock to learn that such a session has no ancestor; the line is due all the same.
    ORVANTA_LOG(info, "getAncestorWithAggregatorForSession: No user info found for session {}", _sessionID);
  } else if (_hierarchy.token && _hierarchy.level >= 1) {
    // Held to the end of the hand-over, so that the hierarchy cannot change under it.
    const std::lock_guard lock(_delegate.lock());
    if (const auto ancestor = _delegate.getAncestorWithAggregatorForSession(*this)) {
      ancestor->sendToAggregator(_sessionInfo, timevalToSeconds(event.time), event.category, event.type,
                                 mergedPayload(event.payload));
      return;
    }
  }
  if (!hasAggregator()) return;
  sendToAggregator(_sessionInfo, timevalToSeconds(event.time), event.category, event.type,
                   mergedPayload(event.payload));
}

SharedDictionary OrvantadSession::mergedPayload(const SharedDictionary& payload) const {
  if (!payload || !_userInfo || _userInfo->empty()) return payload;
  auto merged = std::make_shared<Dictionary>(*payload);
  merged->merge(*_userInfo);
  return merged;
}

bool OrvantadSession::sendToAggregator(const SharedDictionary& sessionInfo, double timestamp, std::uint16_t category,
                                       std::uint16_t type, const SharedDictionary& payload) {
  const std::lock_guard lock(_aggregationLock);
  if (!hasAggregator() || !_client) return false;
  _client->sendMessageToClient(sessionInfo, timestamp, category, type, payload);
  return true;
}

void OrvantadSession::shutdownSessionAggregation() {
  ORVANTA_LOG(debug, "shutdownSessionAggregation: Disable aggregation module for session {}", _sessionID);
  const std::lock_guard lock(_aggregationLock);
  if (hasAggregator() && _client) _client->sendMessageToClient(nullptr, 0.0, 0, 0, nullptr);
  _hasAggregator.store(false, std::memory_order_release);
}

void OrvantadSession::flushMessagesWithCompletion(FlushReply completion) {
  ORVANTA_LOG(debug, "flushMessagesWithCompletion: Flushing messages for session {}", _sessionID);
  internalFlushMessagesWithCompletion(std::move(completion));
}

void OrvantadSession::internalFlushMessagesWithCompletion(FlushReply completion) {
  if (!_backends || _backends->empty()) {
    constexpr const char* kText = "No backends available to send message";
    ORVANTA_LOG(debug, "internalFlushMessagesWithCompletion: {}", kText);
    completion(std::nullopt, makeOrvantaError(kText, -1));
    return;
  }
  const auto request =
      std::make_shared<FlushRequest>(_services, static_cast<std::int32_t>(_backends->size()), std::move(completion));
  for (const auto& [key, backend] : *_backends) {
    backend->flushMessagesWithCompletion(request->completionFor(key, backend->name()));
  }
}

}  // namespace orvanta
