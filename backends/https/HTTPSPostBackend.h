#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "backends/OrvantaBackend.h"
#include "backends/https/ClientIdentity.h"
#include "backends/https/EventBatch.h"
#include "backends/https/EventFilters.h"
#include "backends/https/EventRecord.h"
#include "backends/https/PostMessage.h"
#include "backends/https/PostQueue.h"
#include "backends/https/PostURLs.h"
#include "backends/https/RecordLayer.h"
#include "backends/https/ReportingDecision.h"
#include "backends/https/SessionFields.h"
#include "interface/Values.h"

namespace orvanta {

// Reports events as JSON over HTTPS POST, at once or in batches, as the storebag's section for the session's client
// says.
//
// Everything but setCorrelatedSessionID and what OrvantaBackend allows to other threads is called on the session's
// queue. A disabled backend drops events silently; one that waits for user info or is held batches them. A failed post
// loses its events; a server's 5xx disables the backend until an evaluation sets another state. Posts on their way
// outlive the backend. The mutex is never held while a message is built, a post is started or a completion is called.
class HTTPSPostBackend final : public OrvantaBackend {
 public:
  // Null when there is no profile, no product family or (logged) no client list in the profile.
  static std::shared_ptr<HTTPSPostBackend> create(BackendServices& services, std::string name, SharedDictionary profile,
                                                  const BackendSetup& setup);

  void updateState() override;
  std::optional<std::string> flushMessagesWithCompletion(FlushCompletion completion) override;
  void setCorrelatedSessionID(std::optional<std::string> combined) override;
  void setUserInfoDict(SharedDictionary userInfo) override;

  // The session's queue only.
  const std::optional<std::string>& postURL() const { return _postURLs.postURL(); }
  void setPostURL(std::optional<std::string> url) { _postURLs.setPostURL(std::move(url)); }
  // Why the last evaluation that was not frozen came out as it did; nullopt before the first.
  const std::optional<ReportingReason>& reason() const { return _reason; }

  // A batch that would take more memory than this is flushed like one that has reached its event threshold.
  static constexpr std::size_t kMaximumBatchBytes = 16U << 20U;

 protected:
  std::optional<std::string> sendNumbered(const Event& event) override;

 private:
  HTTPSPostBackend(BackendServices& services, std::string name, SharedDictionary profile, const BackendSetup& setup);

  // HTTPSPostConfiguration.cpp
  ReportingFacts gatherFacts() const;
  void apply(ReportingDecision&& decision, const ReportingFacts& facts);
  void resetBackendStateWithClient(const ReportingSettings::Counters& counters);

  // HTTPSPostBackend.cpp
  struct PreparedEvent {
    EventRecord record;
    std::uint64_t labelsSeen;  // see EventBatch
  };
  PreparedEvent newEventDict(Event event);
  SharedDictionary sessionEndPayload(const SharedDictionary& payload) const;
  std::optional<std::string> batchEvent(PreparedEvent event);
  std::optional<std::string> sendDirectly(const EventRecord& record, const Event& event);
  std::optional<std::string> flushEnabled(FlushCompletion completion);
  std::vector<OutgoingEvent> outgoingEvents(const EventBatch::Events& events, const RecordLayer* userInfo) const;
  PostMessage buildMessage(std::span<const OutgoingEvent> events) const;
  bool showsMessages() const;
  bool hasBatched() const;
  std::size_t batchedBytes() const;

  // HTTPSPostRequest.cpp
  // `event`: the one that the message holds; null for a batch.
  void postJSONMessage(std::string json, const Event* event, PostCompletion completion);
  std::vector<platform::HttpHeader> postHeaders(const Event* event) const;

  // Constant after construction.
  const bool _consentGiven;       // the user's consent to diagnostics submission
  const bool _forceEventLogging;  // show people what is posted, on development and internal environments
  const std::shared_ptr<const SessionFields> _sessionFields;

  // Session's queue only.
  ClientIdentity _clientIdentity;
  EventFilters _filters;
  std::int32_t _eventThreshold = 49;
  std::optional<double> _overrideSampling;
  bool _immutable = false;  // the state is frozen: people have been shown what was sent
  std::optional<ReportingReason> _reason;
  std::shared_ptr<const RecordLayer> _userInfo;  // of userInfoDict
  std::shared_ptr<PostQueue> _postQueue;         // made with the first post
  PostURLs _postURLs;

  EventBatch _batchedEvents GUARDED_BY(mutex());
};

// A user info's text under that key; a number counts as its decimal text.
std::optional<std::string> userInfoText(const SharedDictionary& userInfo, std::string_view key);

}  // namespace orvanta
