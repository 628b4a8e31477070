#include <gtest/gtest.h>

#include <future>

#include "platform/Json.h"
#include "tests/backends/HTTPSFixture.h"
#include "util/Compression.h"

namespace orvanta::test {
namespace {

using platform::HttpRequest;
using platform::HttpResult;

class HTTPSPostRequestTest : public HTTPSFixture {
 protected:
  // A flush whose completion a test waits for, after other things have happened.
  struct Pending {
    std::shared_ptr<FlushAnswer> answer = std::make_shared<FlushAnswer>();
    std::shared_ptr<std::promise<void>> done = std::make_shared<std::promise<void>>();
    FlushCompletion completion() {
      return [answer = answer, done = done](std::optional<std::string> text, std::optional<OrvantaError> error) {
        answer->text = std::move(text);
        answer->error = std::move(error);
        if (++answer->calls == 1) done->set_value();
      };
    }
    bool wait() { return done->get_future().wait_for(kHangGuard) == std::future_status::ready; }
  };
  static HttpResult transportError(std::string text) { return {std::nullopt, std::move(text)}; }
};

TEST_F(HTTPSPostRequestTest, HeadersInTheirOrder) {
  Setup setup;
  setup.identity.isInternal = true;
  setup.identity.selfVersion = "4.2.1";
  setup.userInfo = shared({{"clientName", "Mail"}, {"serviceName", 17}, {"other", "x"}});
  const auto backend = makeBackend(setup);
  send(*backend, 65535, 0, nullptr, 1);
  const HttpRequest request = requests().at(0);
  EXPECT_EQ(request.method, "POST");
  EXPECT_EQ(request.timeout, std::nullopt);
  std::vector<std::string> lines;
  for (const auto& header : request.headers) lines.push_back(header.name + ": " + header.value);
  EXPECT_EQ(lines, (std::vector<std::string>{
                       "X-ORV-Client-Name: Mail", "X-ORV-Service-Name: 17", "X-ORV-Internal-Build: 1",
                       "User-Agent: Orvanta/4.2.1 (Parva3,2; 12.5)", "X-ORV-Client-Version: 42", "X-ORV-Sender: ZK",
                       "X-ORV-Event-Map: 65535 1", "Accept: application/json", "Content-Type: application/json",
                       "Content-Length: " + std::to_string(request.body.size()), "Content-Encoding: gzip"}));
}

TEST_F(HTTPSPostRequestTest, HeadersThatAreNotThere) {
  Setup setup;
  setup.identity.hardwareType.reset();
  setup.identity.productVersion.reset();
  setup.identity.compType = 19;
  setup.userInfo = shared({{"clientName", Array{"Mail"}}});
  const auto backend = makeBackend(setup);
  send(*backend, 1);
  const HttpRequest request = requests().at(0);
  for (const char* name : {"X-ORV-Client-Name", "X-ORV-Service-Name", "X-ORV-Internal-Build"}) {
    EXPECT_EQ(headerOf(request, name), "(absent)") << name;
  }
  EXPECT_EQ(headerOf(request, "User-Agent"), "Orvanta/8.0 ((null); (null))");
  EXPECT_EQ(headerOf(request, "X-ORV-Sender"), "");
}

TEST_F(HTTPSPostRequestTest, EnvelopeOfTheMoment) {
  platform.clock.set(1'700'000'123.25);
  const auto backend = makeBackend({});
  send(*backend, 3, 0, shared({{"a", 1}}));
  const auto body = platform::parseJson(plainBody(requests().at(0)));
  EXPECT_EQ(body->dictionary()->size(), 3U);
  EXPECT_EQ(body->dictionary()->find("postTime")->doubleValue(), 1'700'000'123.25);
  EXPECT_NEAR(body->dictionary()->find("events")->array()->at(0).dictionary()->find("_clientTS")->doubleValue(),
              1'699'999'980 + (1'700'000'123.25 - 1'699'999'990.25), 1e-6);
}

TEST_F(HTTPSPostRequestTest, GzipOnlyWhereItIsSmaller) {
  Array rules;
  for (const auto name : kReservedKeyNames) rules.emplace_back(Dictionary{{"key", name}, {"action", "remove"}});
  Dictionary section = openSection();
  section.set("filters", rules);
  Setup setup;
  setup.identity.requireUserInfo = true;
  setup.userInfo = shared({});
  setup.profile = profileOf({Value(section)});
  const auto backend = makeBackend(setup);
  send(*backend, 1);  // nothing but the envelope
  send(*backend, 1, 0, shared({{"filler", std::string(1000, 'x')}}));
  const auto posted = requests();
  EXPECT_EQ(headerOf(posted[0], "Content-Encoding"), "(absent)");
  EXPECT_EQ(posted[0].body.front(), '{');
  EXPECT_EQ(headerOf(posted[0], "Content-Length"), std::to_string(posted[0].body.size()));
  EXPECT_EQ(headerOf(posted[1], "Content-Encoding"), "gzip");
  EXPECT_LT(posted[1].body.size(), 300U);
  EXPECT_EQ(headerOf(posted[1], "Content-Length"), std::to_string(posted[1].body.size()));
}

TEST_F(HTTPSPostRequestTest, AnswersOfTheServer) {
  for (const int status : {200, 204, 301, 404, 499, 600, 0, 500, 503, 599}) {
    platform.http.answer = [status](const HttpRequest&) { return ScriptedHttpClient::status(status); };
    const LogCapture log;
    Setup setup = batching();
    setup.name = "http_post2";
    const auto backend = makeBackend(setup);
    send(*backend, 1);
    const FlushAnswer answer = flush(*backend);
    EXPECT_EQ(answer.calls, 1) << status;
    if (status >= 500 && status <= 599) {
      const std::string text = "backend http_post2 disabled by server " + std::to_string(status) + " return code";
      EXPECT_EQ(answer.error, makeOrvantaError(text, status));
      EXPECT_TRUE(log.contains("<6>postJSONMessage: " + text));
      EXPECT_EQ(backend->state(), kBackendDisabled);
      send(*backend, 2, 1);
      EXPECT_EQ(flush(*backend).error, makeOrvantaError("Nothing to flush", -1)) << "events are dropped now";
      backend->updateState();
      EXPECT_EQ(backend->state(), kBackendEnabled) << "until the next evaluation";
    } else {
      EXPECT_EQ(answer.error, std::nullopt) << status;
      EXPECT_EQ(backend->state(), kBackendEnabled) << status;
    }
  }
}

TEST_F(HTTPSPostRequestTest, AFrozenBackendStaysDisabled) {
  platform.device.consent = true;
  const auto backend = makeBackend(batching());
  send(*backend, 1);
  ASSERT_TRUE(flush(*backend).text);
  platform.http.answer = [](const HttpRequest&) { return ScriptedHttpClient::status(503); };
  send(*backend, 1, 1);
  settle();
  backend->updateState();
  EXPECT_EQ(backend->state(), kBackendDisabled);
}

TEST_F(HTTPSPostRequestTest, APromotionDoesNotUndoTheServersAnswer) {
  // The server's answer arrives while the backend is held; a promoting event comes later.
  platform.http.hold = true;
  const auto backend = makeBackend({});
  send(*backend, 1);
  settle();
  backend->setState(kBackendSampledOut);
  ASSERT_TRUE(platform.http.finishHeld(ScriptedHttpClient::status(500)));
  send(*backend, 2, 2);
  EXPECT_EQ(backend->state(), kBackendDisabled);
  EXPECT_EQ(requests().size(), 1U);
}

TEST_F(HTTPSPostRequestTest, TransportErrors) {
  platform.http.answer = [](const HttpRequest&) { return transportError("certificate has expired"); };
  const LogCapture log;
  const auto backend = makeBackend(batching());
  send(*backend, 1);
  const FlushAnswer answer = flush(*backend);
  EXPECT_EQ(answer.error, makeOrvantaError("certificate has expired", -1));
  EXPECT_TRUE(log.contains("<3>HTTPSPostBackend(postJsonMessage): post error: certificate has expired"));
  EXPECT_EQ(backend->state(), kBackendEnabled);
  EXPECT_EQ(flush(*backend).error, makeOrvantaError("Nothing to flush", -1)) << "a failed post restores nothing";
}

TEST_F(HTTPSPostRequestTest, NoURL) {
  platform.device.consent = true;
  Setup setup = batching();
  setup.profile = profileOf({});
  const auto backend = makeBackend(setup);
  send(*backend, 1);
  const FlushAnswer answer = flush(*backend);
  EXPECT_EQ(answer.error, makeOrvantaError("postURL is nil", -1));
  EXPECT_TRUE(answer.text) << "what would have been sent";
  EXPECT_EQ(backend->state(), kBackendEnabled);
  EXPECT_TRUE(requests().empty());
  backend->setPostURL("https://later.example");
  send(*backend, 2);
  EXPECT_EQ(flush(*backend).error, std::nullopt);
  EXPECT_EQ(requests().at(0).url, "https://later.example");
}

TEST_F(HTTPSPostRequestTest, AFlushAnswersWhenThePostHasEnded) {
  platform.device.consent = true;
  platform.http.hold = true;
  const auto backend = makeBackend(batching());
  send(*backend, 1);
  Pending pending;
  const auto text = backend->flushMessagesWithCompletion(pending.completion());
  settle();
  EXPECT_EQ(pending.answer->calls, 0);
  ASSERT_TRUE(platform.http.finishHeld(ScriptedHttpClient::status(200)));
  ASSERT_TRUE(pending.wait());
  EXPECT_EQ(pending.answer->text, text);
  EXPECT_TRUE(text);
}

TEST_F(HTTPSPostRequestTest, TheBackendMayGoWhilePostsAreOnTheirWay) {
  for (const int status : {200, 503}) {
    platform.http.hold = true;
    auto backend = makeBackend(batching());
    send(*backend, 1);
    Pending pending;
    backend->flushMessagesWithCompletion(pending.completion());
    settle();
    const std::weak_ptr<HTTPSPostBackend> watch = backend;
    backend.reset();
    EXPECT_TRUE(watch.expired()) << "a post keeps no backend alive";
    ASSERT_TRUE(platform.http.finishHeld(ScriptedHttpClient::status(status)));
    ASSERT_TRUE(pending.wait());
    EXPECT_EQ(pending.answer->calls, 1);
    EXPECT_EQ(pending.answer->error.has_value(), status == 503);
  }
}

TEST_F(HTTPSPostRequestTest, ADroppedPostIsReported) {
  // A client that loses a request without a word, as a pool does with jobs that it never ran.
  const auto answer = std::make_shared<FlushAnswer>();
  {
    TestPlatform own;
    own.http.hold = true;
    const auto backend = HTTPSPostBackend::create(own, "http_post", shared(profileOf({Value(openSection())})), "Parva");
    backend->setIdentity(defaultIdentity());
    backend->setBatchEvents(true);
    backend->updateState();
    send(*backend, 1);
    backend->flushMessagesWithCompletion([answer](std::optional<std::string>, std::optional<OrvantaError> error) {
      ++answer->calls;
      answer->error = std::move(error);
    });
    ASSERT_TRUE(PendingPosts::of(own)->waitUntilHandedIn(kHangGuard));
    EXPECT_EQ(answer->calls, 0);
  }
  EXPECT_EQ(answer->calls, 1);
  EXPECT_TRUE(answer->error);
}

TEST_F(HTTPSPostRequestTest, WaitingBytesAreBounded) {
  // Both threads of the pool are busy, so that nothing is compressed.
  std::promise<void> release;
  const std::shared_future<void> released = release.get_future().share();
  for (int i = 0; i < 2; ++i) platform.get().pool().post([released] { released.wait(); });
  const LogCapture log;
  const auto backend = makeBackend(batching());
  const std::string huge(PostQueue::kMaximumWaitingBytes + 1, 'x');
  std::vector<Pending> pending(3);
  // A message of any size may wait alone; then there is room for none.
  for (std::size_t i = 0; i < pending.size(); ++i) {
    send(*backend, 1, 0, i == 0 ? shared({{"filler", huge}}) : nullptr);
    backend->flushMessagesWithCompletion(pending[i].completion());
  }
  EXPECT_EQ(pending[0].answer->calls, 0);
  for (std::size_t i = 1; i < pending.size(); ++i) {
    EXPECT_EQ(pending[i].answer->calls, 1);
    ASSERT_TRUE(pending[i].answer->error);
    EXPECT_EQ(pending[i].answer->error->code, -1);
    EXPECT_NE(pending[i].answer->error->description.find("bytes wait to be posted"), std::string::npos);
  }
  EXPECT_EQ(log.count("<3>HTTPSPostBackend(postJsonMessage): post error: "), 2U);
  EXPECT_FALSE(PendingPosts::of(platform)->waitUntilHandedIn(std::chrono::milliseconds(0)));
  release.set_value();
  ASSERT_TRUE(pending[0].wait());
  settle();
  send(*backend, 1);
  EXPECT_EQ(flush(*backend).error, std::nullopt) << "there is room again";
  EXPECT_EQ(requests().size(), 2U);
}

}  // namespace
}  // namespace orvanta::test
