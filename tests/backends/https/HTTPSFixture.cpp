#include "tests/backends/https/HTTPSFixture.h"

#include "platform/codec/Json.h"
#include "tools/collector/wire/MessageReader.h"

namespace orvanta::test {

std::string gunzip(const std::string& bytes) {
  return collector::inflateBody(bytes, 64U << 20U).value();
}

std::string headerOf(const platform::HttpRequest& request, std::string_view name) {
  for (const auto& header : request.headers) {
    if (header.name == name) return header.value;
  }
  return "(absent)";
}

std::string plainBody(const platform::HttpRequest& request) {
  return headerOf(request, "Content-Encoding") == "gzip" ? gunzip(request.body) : request.body;
}

Dictionary envelopeOf(const platform::HttpRequest& request) {
  auto body = platform::parseJson(plainBody(request));
  if (body && body->dictionary() != nullptr) return std::move(*body->dictionary());
  ADD_FAILURE() << (body ? "no dictionary" : body.error());
  return {};
}

std::vector<Dictionary> postedEvents(const platform::HttpRequest& request) {
  std::vector<Dictionary> events;
  const Value body(envelopeOf(request));
  const Value* list = body.dictionary()->find("events");
  EXPECT_TRUE(list != nullptr && list->array() != nullptr) << "no events";
  for (const Value& event : list == nullptr ? Array() : *list->array()) events.push_back(*event.dictionary());
  return events;
}

Dictionary HTTPSFixture::openSection(const Dictionary& more) {
  Dictionary section{{"locale_whitelist", Array{"DE"}},
                     {"filters", Array{Dictionary{{"key", "nothingOfThatName"}, {"action", "remove"}}}},
                     {"override_dnu", 1},
                     {"sampling_threshold", 1},
                     {"event_threshold", 49},
                     {"post_url", "https://events.example/batch"},
                     {"realtime_post_url", "https://events.example/realtime"}};
  section.merge(more);
  for (const auto& [key, value] : more) {
    if (value.isNull()) section.erase(key);
  }
  return section;
}

HTTPSFixture::Setup HTTPSFixture::requiring(const Dictionary& more, bool batches) {
  Setup setup = batching(more);
  setup.batchEvents = batches;
  setup.identity.requireUserInfo = true;
  setup.userInfo = shared({{"clientName", "Mail"}, {"serviceName", "imap"}});
  return setup;
}

BackendIdentity HTTPSFixture::defaultIdentity() {
  BackendIdentity identity;
  identity.sessionID = 77;
  identity.clientType = 5;
  identity.clientVersion = 42;
  identity.deviceID = "0123456789abcdef0123456789abcdef01234567";
  identity.productFamily = "Parva";
  identity.productVersion = "12.5";
  identity.buildVersion = "12F5";
  identity.productType = "Parva3,2";
  identity.selfVersion = {8, 0, 0};
  identity.startTimestamp = {1'699'999'990, 250'000};
  return identity;
}

std::shared_ptr<HTTPSPostBackend> HTTPSFixture::makeBackend(const Setup& setup, TestBackends& on) {
  auto backend = HTTPSPostBackend::create(on, setup.name, shared(setup.profile),
                                          {setup.identity, setup.batchEvents, setup.userInfo});
  if (!backend) return nullptr;
  backend->setSamplingFactor(setup.samplingFactor);
  backend->setCombinedSessionIDString("own");
  if (setup.evaluate) backend->updateState();
  return backend;
}

std::optional<std::string> HTTPSFixture::send(OrvantaBackend& backend, std::uint16_t method, std::int32_t flag,
                                              const SharedDictionary& payload, std::uint16_t respCode) {
  Event event{payload, platform.clock.timeOfDay(), method, respCode, static_cast<EventFlag>(flag)};
  return backend.sendMessage(event);
}

FlushAnswer HTTPSFixture::flush(HTTPSPostBackend& backend) {
  auto answer = std::make_shared<FlushAnswer>();
  backend.flushMessagesWithCompletion([&, answer](std::optional<std::string> text, std::optional<OrvantaError> error) {
    backend.samplingThreshold();  // takes the backend's lock, which must not be held here
    ++answer->calls;
    answer->text = std::move(text);
    answer->error = std::move(error);
  });
  settle();
  return *answer;
}

std::promise<void> HTTPSFixture::holdCompressing() {
  std::promise<void> release;
  const std::shared_future<void> released = release.get_future().share();
  for (int i = 0; i < 2; ++i) platform.get().pool().makeComputeQueue()->post([released] { released.wait(); });
  return release;
}

void HTTPSFixture::settle() {
  ASSERT_TRUE(platform.services.pendingPosts->waitUntilSubmitted(kHangGuard));
}

HTTPSFixture::Posts HTTPSFixture::fields(std::string_view key) {
  Posts all;
  for (const auto& request : requests()) {
    std::string text;
    for (const Dictionary& event : postedEvents(request)) {
      const Value* value = event.find(key);
      text += (text.empty() ? "" : " ") + (value == nullptr ? "none" : value->description());
    }
    all.push_back(std::move(text));
  }
  return all;
}

std::vector<platform::HttpRequest> HTTPSFixture::requests() {
  settle();
  return platform.http.requests();
}

}  // namespace orvanta::test
