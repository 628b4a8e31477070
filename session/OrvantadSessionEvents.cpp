#include <fmt/format.h>

#include "config/MessageLog.h"
#include "interface/FileURL.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"
#include "interface/RemoteCalls.h"
#include "session/OrvantadSession.h"

// The reporting half of a session: events on their way to aggregating clients and to the backends; flushes; uploads.

namespace orvanta {

namespace {

constexpr const char* kNoBackends = "sendMessageWithDictionary: No backends available to send message";

// A mandatory number, cut to its low 16 bits; nullopt when it is missing or not a number.
std::optional<std::uint16_t> number(const Dictionary& parameters, std::string_view key) {
  const Value* value = parameters.find(key);
  if (value == nullptr || !value->isNumber()) return std::nullopt;
  return static_cast<std::uint16_t>(static_cast<std::uint32_t>(value->integerValue()));
}

}  // namespace

void OrvantadSession::sendMessageWithCategory(std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                                              StringReply reply) {
  ORVANTA_LOG(debug, "sendMessageWithCategory: Sending message for session {}", sessionID());
  reply(send(category, type, std::move(payload)));
}

std::optional<std::string> OrvantadSession::send(std::uint16_t category, std::uint16_t type, SharedDictionary payload) {
  if (!_backends) {
    ORVANTA_LOG(debug, "{}", kNoBackends);
    return std::nullopt;
  }
  return dispatch({.payload = std::move(payload), .category = category, .type = type});
}

void OrvantadSession::sendMessageWithDictionary(SharedDictionary parameters, StringReply reply) {
  ORVANTA_LOG(debug, "sendMessageWithCategory: Sending message for session {}", sessionID());
  if (!_backends) {
    ORVANTA_LOG(debug, "{}", kNoBackends);
    reply(std::nullopt);
    return;
  }
  const auto category = number(*parameters, kOrvantaMessageParametersCategory);
  if (!category) {
    ORVANTA_LOG(debug, "sendMessageWithDictionary: Missing mandatory parameter 'category'");
    reply(std::nullopt);
    return;
  }
  const auto type = number(*parameters, kOrvantaMessageParametersType);
  if (!type) {
    ORVANTA_LOG(debug, "sendMessageWithDictionary: Missing mandatory parameter 'type'");
    reply(std::nullopt);
    return;
  }
  Event event{.category = *category, .type = *type};
  if (const Dictionary* payload = parameters->dictionary(kOrvantaMessageParametersPayload)) {
    // The payload stays inside the parameters, which it keeps alive.
    event.payload = SharedDictionary(parameters, payload);
  }
  if (const Value* flag = parameters->find(kOrvantaMessageParametersFlag); flag && flag->isNumber()) {
    event.flag = static_cast<EventFlag>(static_cast<std::uint32_t>(flag->integerValue()));
  }
  reply(dispatch(std::move(event)));
}

std::optional<std::string> OrvantadSession::dispatch(Event event) {
  event.time = _platform.clock().timeOfDay();
  aggregateMessage(event);
  return _backends->dispatch(std::move(event));
}

void OrvantadSession::internalSendMessage(SharedDictionary payload, std::uint16_t category, std::uint16_t type) {
  send(category, type, std::move(payload));
  ORVANTA_LOG(debug, "internalSendMessage: Sent internal message (method:{} respCode:{})", category, type);
}

void OrvantadSession::sendMessageWithSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                                 std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                                                 StringReply reply) {
  if (!sessionInfo->contains(kOrvantaSessionInfoClientType) || !sessionInfo->contains(kOrvantaSessionInfoSessionID)) {
    ORVANTA_LOG(error, "sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo");
    return;
  }
  auto info = SessionInfoRecord::read(*sessionInfo);
  if (auto problem = info.hierarchy.refusal()) {
    ORVANTA_LOG(warning, "sendMessageWithSessionInfo: Refused for session {}: {}", sessionID(), *problem);
    reply.fail({"sendMessageWithSessionInfo: " + *problem});
    return;
  }
  configure(std::move(sessionInfo), std::move(info));
  receivedUserInfo(userInfo);
  ORVANTA_LOG(debug, "sendMessageWithSessionInfo: Sending message with session info for session {}", sessionID());
  const SharedDictionary storebag = _delegate.storebagForSession(*this);
  if (!storebag) {
    reply("storebag not available");
    return;
  }
  sendSingleMessage(userInfo, storebag, {.payload = std::move(payload), .category = category, .type = type});
  reply("finished");
}

// Through backends of its own. `userInfo` is the call's, which the session may have refused.
void OrvantadSession::sendSingleMessage(const SharedDictionary& userInfo, const SharedDictionary& storebag,
                                        Event event) const {
  const Value* sessionID = _sessionInfo ? _sessionInfo->find(kOrvantaSessionInfoSessionID) : nullptr;
  ORVANTA_LOG(debug, "sendMessageWithSessionInfo: Sending single message with sessionID {}",
              sessionID ? sessionID->integerValue() : 0);
  if (!_sessionInfo || !storebag) {
    ORVANTA_LOG(error, "RsendMessageWithSessionInfo: Attempted to send message with one or more nil parameters");
    return;
  }
  DeviceIDBuffer deviceID{};
  copyUniqueDeviceID(_platform, deviceID);
  const auto backends = BackendSet::create(_services, storebag, &_info, userInfo, deviceID);
  if (!backends) {
    ORVANTA_LOG(error, "sendMessageWithSessionInfo: No backends available to send single message");
    return;
  }
  if (userInfo && !_info.requireUserInfo) {
    ORVANTA_LOG(warning, "sendMessageWithSessionInfo: user info provided without requiring it.");
  }
  event.time = _platform.clock().timeOfDay();
  backends->dispatchSingle(std::move(event));
  backends->cleanup();
}

void OrvantadSession::aggregateMessage(Event event) {
  const auto mergeUserInfo = [this, &event] {
    if (!event.payload || !_userInfo || _userInfo->empty()) return;
    auto merged = std::make_shared<Dictionary>(*event.payload);
    merged->merge(*_userInfo);
    event.payload = std::move(merged);
  };
  if (!_userInfo) {
    // Such a session has no ancestor, which takes no lock to find out; the line is due all the same.
    ORVANTA_LOG(info, "getAncestorWithAggregatorForSession: No user info found for session {}", sessionID());
  } else if (_info.hierarchy.token && _info.hierarchy.level >= 1) {
    // Held until the event is in the ancestor's outbox, so that the hierarchy cannot change meanwhile.
    const AgentLock::Held lock(_delegate.lock());
    if (const auto ancestor = _delegate.getAncestorWithAggregatorForSession(*this)) {
      mergeUserInfo();
      ancestor->sendToAggregator(_sessionInfo, event);
      return;
    }
  }
  if (!hasAggregator()) return;
  mergeUserInfo();
  sendToAggregator(_sessionInfo, event);
}

void OrvantadSession::shutdownSessionAggregation() {
  ORVANTA_LOG(debug, "shutdownSessionAggregation: Disable aggregation module for session {}", sessionID());
  _aggregation.shutdown();
}

void OrvantadSession::flushMessagesWithCompletion(FlushReply completion) {
  ORVANTA_LOG(debug, "flushMessagesWithCompletion: Flushing messages for session {}", sessionID());
  if (!_backends || _backends->empty()) {
    constexpr const char* kText = "No backends available to send message";
    ORVANTA_LOG(debug, "internalFlushMessagesWithCompletion: {}", kText);
    completion(std::nullopt, makeOrvantaError(kText, -1));
    return;
  }
  _backends->flush(std::move(completion));
}

void OrvantadSession::uploadFileAtPath(std::string fileURL, std::optional<std::string> extensionToken,
                                       UploadReply completion) {
  const platform::BlockingScope blocking;  // a descriptor may take long to be looked at, and even to be closed
  ORVANTA_LOG(debug, "uploadFileAtPath: Uploading file for session {}", sessionID());
  OrvantaBackend::UploadFile file;
  file.path = pathForFileURL(fileURL).value_or(fileURL);
  file.extensionToken = std::move(extensionToken);
  // The descriptor that came with the token: the only way to the file's content. Closed when this call ends.
  platform::UniqueFd descriptor;
  if (file.extensionToken && _connection) descriptor = _connection->takeDescriptor();
  file.descriptor = descriptor.get();
  file.removeFile = [this, token = file.extensionToken] {
    if (token && _connection) _connection->outbox()->send(encodeRemoveFile(*token));
  };

  const bool uploaded = _backends && _backends->uploadFileAtPath(file);
  if (uploaded) {
    ORVANTA_LOG(debug, "uploadFileWithURL: File upload successful for {}", file.path);
  } else {
    ORVANTA_LOG(error, "uploadFileWithURL: File upload failed for {}", file.path);
  }
  writeToLogFile(_platform,
                 fmt::format("[uploadFileWithURL] Upload {} for file {}", uploaded ? "succeeded" : "failed", fileURL));
  completion(uploaded);
}

void OrvantadSession::uploadLogData(SharedArray logData, LogDataReply completion) {
  const bool uploaded = _backends && _backends->uploadLogData(logData);
  if (uploaded) {
    ORVANTA_LOG(debug, "uploadLogData: Log data array upload successful");
  } else {
    ORVANTA_LOG(error, "uploadLogData: Log data array upload failed");
  }
  completion(uploaded, std::nullopt);
}

}  // namespace orvanta
