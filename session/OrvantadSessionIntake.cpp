#include <fmt/format.h>

#include "config/MessageLog.h"
#include "interface/OrvantaLogging.h"
#include "session/OrvantadSession.h"

// Events on their way in: the checks, the dispatch to the backends, and the one-off send.

namespace orvanta {

namespace {

constexpr const char* kNoBackends = "sendMessageWithDictionary: No backends available to send message";

// A mandatory number, cut to its low 16 bits; none when it is missing or no number.
std::optional<std::uint16_t> number(const Dictionary& parameters, std::string_view key) {
  const Value* value = parameters.find(key);
  if (value == nullptr || !value->isNumber()) return std::nullopt;
  return static_cast<std::uint16_t>(static_cast<std::uint32_t>(value->integerValue()));
}

// Whether the backend's lists let the category through; logs when they don't.
bool admits(const OrvantaBackend& backend, std::uint16_t category, const char* operation) {
  if (!backend.isWhitelistedEvent(category)) {
    ORVANTA_LOG(debug, "{}: Dropping event with category {} as it is not whitelisted for backend {}", operation,
                category, backend.name());
    return false;
  }
  if (backend.isBlacklistedEvent(category)) {
    ORVANTA_LOG(debug, "{}: Dropping event with category {} as it is blacklisted for backend {}", operation, category,
                backend.name());
    return false;
  }
  return true;
}

}  // namespace

void OrvantadSession::sendMessageWithCategory(std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                                              StringReply reply) {
  ORVANTA_LOG(debug, "sendMessageWithCategory: Sending message for session {}", _sessionID);
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
  ORVANTA_LOG(debug, "sendMessageWithCategory: Sending message for session {}", _sessionID);
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
  if (const Value* payload = parameters->find(kOrvantaMessageParametersPayload); payload && payload->dictionary()) {
    // The payload stays inside the parameters, which it keeps alive.
    event.payload = SharedDictionary(parameters, payload->dictionary());
  }
  if (const Value* flag = parameters->find(kOrvantaMessageParametersFlag); flag && flag->isNumber()) {
    event.flag = static_cast<EventFlag>(static_cast<std::uint32_t>(flag->integerValue()));
  }
  reply(dispatch(std::move(event)));
}

std::optional<std::string> OrvantadSession::dispatch(Event event) {
  event.time = _platform.clock().timeOfDay();
  aggregateMessage(event);

  std::optional<std::string> reply;
  for (const auto& [key, backend] : *_backends) {
    if (!admits(*backend, event.category, "sendMessageWithDictionary")) continue;
    auto result = backend->sendMessage(event);
    if (!result) continue;
    writeToLogFile(_platform, fmt::format("[{} -> sendMessageWithDictionary] {}", backend->name(), *result));
    const bool isHTTPS = backend->name() == kOrvantaBackendHTTPPost2 || backend->name() == kOrvantaBackendHTTPPost;
    if (isHTTPS || (backend->name() == kOrvantaBackendDashboard && !reply)) reply = std::move(result);
  }
  return reply;
}

void OrvantadSession::internalSendMessage(SharedDictionary payload, std::uint16_t method, std::uint16_t respCode) {
  send(method, respCode, std::move(payload));
  ORVANTA_LOG(debug, "internalSendMessage: Sent internal message (method:{} respCode:{})", method, respCode);
}

void OrvantadSession::sendMessageWithSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                                 std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                                                 StringReply reply) {
  if (!sessionInfo->contains(kOrvantaSessionInfoClientType) || !sessionInfo->contains(kOrvantaSessionInfoSessionID)) {
    ORVANTA_LOG(error, "sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo");
    return;
  }
  if (auto problem = refusalOfHierarchy(*sessionInfo)) {
    ORVANTA_LOG(warning, "sendMessageWithSessionInfo: Refused for session {}: {}", _sessionID, *problem);
    reply.fail({"sendMessageWithSessionInfo: " + *problem});
    return;
  }
  configure(sessionInfo);
  receivedUserInfo(userInfo);
  ORVANTA_LOG(debug, "sendMessageWithSessionInfo: Sending message with session info for session {}", _sessionID);
  const SharedDictionary storebag = _delegate.storebagForSession(*this);
  if (!storebag) {
    reply("storebag not available");
    return;
  }
  sendSingleMessage(_services, sessionInfo, userInfo, storebag,
                    {.payload = std::move(payload), .category = category, .type = type});
  reply("finished");
}

void OrvantadSession::sendSingleMessage(DaemonServices& services, const SharedDictionary& sessionInfo,
                                        const SharedDictionary& userInfo, const SharedDictionary& storebag,
                                        Event event) {
  const Value* sessionID = sessionInfo ? sessionInfo->find(kOrvantaSessionInfoSessionID) : nullptr;
  ORVANTA_LOG(debug, "sendMessageWithSessionInfo: Sending single message with sessionID {}",
              sessionID ? sessionID->integerValue() : 0);
  if (!sessionInfo || !storebag) {
    ORVANTA_LOG(error, "RsendMessageWithSessionInfo: Attempted to send message with one or more nil parameters");
    return;
  }
  DeviceIDBuffer deviceID{};
  copyUniqueDeviceID(services.platform, deviceID);
  const auto backends = createBackends(services, storebag, sessionInfo, userInfo, deviceID);
  if (!backends) {
    ORVANTA_LOG(error, "sendMessageWithSessionInfo: No backends available to send single message");
    return;
  }
  if (userInfo && !SessionInfoRecord::read(*sessionInfo).requireUserInfo) {
    ORVANTA_LOG(warning, "sendMessageWithSessionInfo: user info provided without requiring it.");
  }
  event.time = services.platform.clock().timeOfDay();
  for (const auto& [key, backend] : *backends) {
    backend->updateState();
    if (!admits(*backend, event.category, "sendMessageWithSessionInfo")) continue;
    const auto result = backend->sendMessage(event);
    if (result)
      writeToLogFile(services.platform, fmt::format("[{} -> sendMessageWithSessionInfo] {}", backend->name(), *result));
  }
  for (const auto& [key, backend] : *backends) backend->cleanup();
}

}  // namespace orvanta
