#include "backends/https/HTTPSPostBackend.h"

#include <fmt/format.h>

#include "backends/https/ClientSection.h"
#include "backends/https/Disposition.h"
#include "config/Conversions.h"
#include "config/DeviceInfo.h"
#include "config/Environment.h"
#include "config/Orvanta.h"
#include "config/Storebag.h"
#include "config/UserDefaultKeys.h"
#include "interface/OrvantaConstants.h"
#include "interface/OrvantaLogging.h"

namespace orvanta {
namespace {

constexpr std::int32_t kLocalFailure = -1;
// More than that is milliseconds of work to put into a message.
constexpr std::size_t kLargeBatch = 512U << 10U;

bool isSessionEnd(const Event& event) {
  return event.category == 0 && event.type == 1;
}

void completeWithError(FlushCompletion& completion, const char* description) {
  if (completion) completion(std::nullopt, makeOrvantaError(description, kLocalFailure));
}

bool forcesEventLogging(Platform& platform) {
  const auto text = userDefaultStringForKey(platform, kForceEventLoggingKey);
  return text && Value(*text).boolValue();
}

}  // namespace

std::shared_ptr<HTTPSPostBackend> HTTPSPostBackend::create(BackendServices& services, std::string name,
                                                           SharedDictionary profile, const BackendSetup& setup) {
  if (!profile || setup.identity.productFamily.empty()) return nullptr;
  if (clientSections(*profile) == nullptr) {
    ORVANTA_LOG(error, "HTTPSPostBackend(initWithName): can't find the client list.");
    return nullptr;
  }
  return std::shared_ptr<HTTPSPostBackend>(new HTTPSPostBackend(services, std::move(name), std::move(profile), setup));
}

HTTPSPostBackend::HTTPSPostBackend(BackendServices& services, std::string name, SharedDictionary profile,
                                   const BackendSetup& setup)
    : OrvantaBackend(services, std::move(name), std::move(profile), setup),
      _consentGiven(services.platform().device().diagnosticsSubmissionAllowed()),
      _forceEventLogging(forcesEventLogging(services.platform())),
      _sessionFields(SessionFields::of(setup.identity, services.config.isInternalBuild())),
      _clientIdentity{services.config.orvanta().getPersistentIdentifierForDNU(true),
                      services.config.orvanta().getPersistentIdentifierForDNU(false)},
      _userInfo(RecordLayer::of(setup.userInfo)),
      _postURLs(userDefaultStringForKey(services.platform(), kPostURLKey),
                userDefaultStringForKey(services.platform(), kRealtimePostURLKey)) {
  if (const std::string* url = textUnder(*this->profile(), StorebagKey::httpsDisplayURL)) setDisplayURL(*url);
}

void HTTPSPostBackend::setUserInfoDict(SharedDictionary userInfo) {
  // Equal user info keeps its layer, which waiting events share with those to come.
  const bool same = _userInfo && userInfo && *userInfo == _userInfo->entries();
  if (!same) _userInfo = RecordLayer::of(userInfo);
  OrvantaBackend::setUserInfoDict(std::move(userInfo));
}

std::optional<std::string> HTTPSPostBackend::sendNumbered(const Event& event) {
  const bool knowsUser = !identity().requireUserInfo || userInfoDict() != nullptr;
  const auto becomes = [&](BackendState at, EventFlag flag) { return disposition(at, flag, batchEvents(), knowsUser); };
  if (becomes(state(), event.flag) == Disposition::drop) return std::nullopt;
  Event kept = event;
  if (isSessionEnd(event)) kept.payload = sessionEndPayload(event.payload);
  PreparedEvent prepared = newEventDict(std::move(kept));
  prepared.record.prepare(_userInfo, _filters);

  if (isPromoting(event.flag)) {
    // Only a held backend is promoted: the server may have disabled it this moment.
    BackendState held = kBackendHeld;
    stateCell().compare_exchange_strong(held, kBackendEnabled);
  }
  ORVANTA_LOG(debug, "HTTPSPostBackend(sendMessage): realtime is {:d}", isRealtime(event.flag));
  // Decided again: the parent's session or the server may have changed the state meanwhile. What was taken is not
  // dropped any more, and what was promoted above is held only when it has been held anew.
  const BackendState now = state();
  const BackendState decisive = now == kBackendDisabled ? kBackendEnabled : now;
  const EventFlag unpromoting = isRealtime(event.flag) ? EventFlag::realtime : EventFlag::none;
  if (becomes(decisive, unpromoting) == Disposition::post) return sendDirectly(prepared.record, event);

  ORVANTA_LOG(debug, "HTTPSPostBackend(sendMessage): Batching {}, {:d}, {:d}", int{now}, batchEvents(),
              identity().requireUserInfo);
  return batchEvent(std::move(prepared));
}

SharedDictionary HTTPSPostBackend::sessionEndPayload(const SharedDictionary& payload) const {
  ORVANTA_LOG(debug,
              "HTTPSPostBackend(sendMessage): Adding dnu type and sampling threshold to SESSION_TYPE_STOP message "
              "dictionary");
  if (!payload) {
    ORVANTA_LOG(error, "HTTPSPostBackend(sendMessage): SESSION_TYPE_STOP message dictionary is nil");
    return payload;
  }
  const auto numberOrNone = [](std::optional<double> number) { return number ? Value(*number) : Value(-1); };
  auto extended = std::make_shared<Dictionary>(*payload);
  extended->set("Opt", static_cast<int>(_clientIdentity.dnuType()));
  extended->set("SamplingThreshold", numberOrNone(samplingThreshold()));
  extended->set("OverrideSampling", numberOrNone(_overrideSampling));
  extended->set("Batch", batchEvents() ? 1 : 0);
  return extended;
}

HTTPSPostBackend::PreparedEvent HTTPSPostBackend::newEventDict(Event event) {
  std::uint64_t labelsSeen = 0;
  {
    // Before the identifier is read, so that a relabelling in between is taken for one that the record missed.
    const platform::MutexLock lock(mutex());
    labelsSeen = _batchedEvents.labels();
  }
  const std::int32_t timezoneOffset = platform().device().timeZoneOffset(platform().clock().wallSeconds());
  return {EventRecord(_sessionFields, std::move(event), combinedSessionIDString(), timezoneOffset), labelsSeen};
}

std::optional<std::string> HTTPSPostBackend::batchEvent(PreparedEvent event) {
  const std::int32_t category = event.record.category();
  const std::size_t footprint = event.record.footprint();
  std::int32_t count = 0;
  std::size_t waitingBytes = 0;
  const auto look = [&] {
    const platform::MutexLock lock(mutex());
    count = _batchedEvents.countOf(category);
    waitingBytes = _batchedEvents.footprint();
  };
  look();
  const bool reached = count > _eventThreshold;
  // Events that must not leave cannot be flushed; they are dropped below.
  const bool tooLarge =
      waitingBytes != 0 && waitingBytes + footprint > kMaximumBatchBytes && state() == kBackendEnabled;
  std::optional<std::string> flushed;
  if (reached || tooLarge) {
    if (reached) {
      ORVANTA_LOG(
          debug,
          "HTTPSPostBackend(batchEvent): Flushing all batched events as we reached event threshold for method {}",
          category);
    } else {
      ORVANTA_LOG(notice, "HTTPSPostBackend(batchEvent): Flushing all batched events as they take {} bytes",
                  waitingBytes);
    }
    flushed = flushMessagesWithCompletion({});
    look();
    if (reached) count = 0;
  }
  EventBatch::Events dropped;
  const platform::MutexLock lock(mutex());
  if (waitingBytes != 0 && waitingBytes + footprint > kMaximumBatchBytes) {
    // A flush keeps what it must not send; that must not grow for ever.
    ORVANTA_LOG(warning, "HTTPSPostBackend(batchEvent): Dropping all batched events as they take {} bytes",
                waitingBytes);
    dropped = _batchedEvents.take();
  }
  _batchedEvents.append(std::move(event.record), footprint, count, event.labelsSeen);
  return flushed;
}

std::optional<std::string> HTTPSPostBackend::sendDirectly(const EventRecord& record, const Event& event) {
  std::optional<std::string> flushed;
  if (state() == kBackendEnabled && isRealtime(event.flag) && hasBatched()) {
    ORVANTA_LOG(debug,
                "HTTPSPostBackend(sendMessage): Got a realtime event and some events have already been batched. "
                "Forcing Flush here to keep events in order.");
    flushed = flushMessagesWithCompletion({});
  }
  ORVANTA_LOG(debug, "HTTPSPostBackend(sendMessage): Sending {}, {:d}, {:d}", int{state()}, batchEvents(),
              identity().requireUserInfo);
  const OutgoingEvent outgoing{&record, {}};
  PostMessage message = buildMessage({&outgoing, 1});
  std::optional<std::string> result = std::move(message.prettyJsonString);
  if (flushed) {
    result = fmt::format("Flushed events:\n{}\nStandalone event:\n{}", *flushed, result.value_or("(null)"));
  }
  postJSONMessage(std::move(message.json), &event, {});
  if (flushed) _immutable = true;
  return result;
}

std::optional<std::string> HTTPSPostBackend::flushMessagesWithCompletion(FlushCompletion completion) {
  if (hasBatched()) {
    std::optional<platform::BlockingScope> large;
    if (batchedBytes() > kLargeBatch) large.emplace();
    if (state() == kBackendEnabled) return flushEnabled(std::move(completion));
    EventBatch::Events dropped;
    const platform::MutexLock lock(mutex());
    dropped = _batchedEvents.take();
  }
  completeWithError(completion, "Nothing to flush");
  return std::nullopt;
}

std::optional<std::string> HTTPSPostBackend::flushEnabled(FlushCompletion completion) {
  if (identity().requireUserInfo && !userInfoDict()) {
    completeWithError(completion, "Can not flush: userInfo is required");
    return std::nullopt;
  }
  ORVANTA_LOG(debug, "HTTPSPostBackend(flushMessagesWithCompletion): called");
  std::shared_ptr<const RecordLayer> userInfo = _userInfo;
  if (userInfo && !_filters.empty()) {
    auto filtered = std::make_shared<Dictionary>(userInfo->entries());
    _filters.filterEvent(*filtered);
    if (*filtered != userInfo->entries()) userInfo = RecordLayer::of(std::move(filtered));
  }
  EventBatch::Events events;
  {
    const platform::MutexLock lock(mutex());
    events = _batchedEvents.take();
    _batchedEvents.clearCounts();
  }
  const std::vector<OutgoingEvent> outgoing = outgoingEvents(events, userInfo.get());
  if (outgoing.empty()) {
    completeWithError(completion, "Nothing to flush: batched events were completely filtered out");
    return std::nullopt;
  }
  PostMessage message = buildMessage(outgoing);
  std::optional<std::string> text = message.prettyJsonString;
  PostCompletion posted;
  if (completion) {
    posted = [completion = std::move(completion), text = std::move(message.prettyJsonString)](
                 std::optional<OrvantaError> error) mutable { completion(std::move(text), std::move(error)); };
  }
  postJSONMessage(std::move(message.json), nullptr, std::move(posted));
  if (text) _immutable = true;
  return text;
}

std::vector<OutgoingEvent> HTTPSPostBackend::outgoingEvents(const EventBatch::Events& events,
                                                            const RecordLayer* userInfo) const {
  std::vector<OutgoingEvent> outgoing;
  outgoing.reserve(events.records.size());
  for (std::size_t i = 0; i < events.records.size(); ++i) {
    const EventRecord& record = events.records[i];
    const auto category = static_cast<std::uint16_t>(record.category());
    if (!isWhitelistedEvent(category)) {
      ORVANTA_LOG(
          debug, "flushMessagesWithCompletion: Dropping event with category {} as it is not whitelisted for backend {}",
          category, name());
      continue;
    }
    if (isBlacklistedEvent(category)) {
      ORVANTA_LOG(debug,
                  "flushMessagesWithCompletion: Dropping event with category {} as it is blacklisted for backend {}",
                  category, name());
      continue;
    }
    EventRecord::Overlay overlay = events.overlayFor(i);
    overlay.userInfo = userInfo;
    outgoing.push_back({&record, overlay});
  }
  return outgoing;
}

PostMessage HTTPSPostBackend::buildMessage(std::span<const OutgoingEvent> events) const {
  const double postTime = timevalToSeconds(platform().clock().timeOfDay());
  return createMessageForPostAndLogging(postTime, _clientIdentity.choose(identity().isInternal, identity().deviceID),
                                        events, showsMessages());
}

// Users see what was sent where they consented to it; developers, in environments of theirs, where they asked for it.
bool HTTPSPostBackend::showsMessages() const {
  if (_clientIdentity.dnuType() == ClientIdentity::kConsentRespected && _consentGiven) return true;
  if (!_forceEventLogging) return false;
  const EnvironmentType environment = services().config.currentEnvironmentType();
  return environment == EnvironmentType::development || environment == EnvironmentType::internal;
}

bool HTTPSPostBackend::hasBatched() const {
  const platform::MutexLock lock(mutex());
  return _batchedEvents.exists();
}

std::size_t HTTPSPostBackend::batchedBytes() const {
  const platform::MutexLock lock(mutex());
  return _batchedEvents.footprint();
}

void HTTPSPostBackend::setCorrelatedSessionID(std::optional<std::string> combined) {
  setCombinedSessionIDString(combined);
  const platform::MutexLock lock(mutex());
  _batchedEvents.relabel(combined);
}

}  // namespace orvanta
