#include <gtest/gtest.h>

#include <future>

#include "tests/backends/https/HTTPSFixture.h"
#include "tests/platform/Waiting.h"

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
};

TEST_F(HTTPSPostRequestTest, HeadersInTheirOrder) {
  Setup setup;
  setup.identity.isInternal = true;
  setup.identity.selfVersion = {4, 2, 1};
  setup.userInfo = shared({{"clientName", "Mail"}, {"serviceName", 17}, {"other", "x"}});
  send(*makeBackend(setup), 65535, 0, nullptr, 1);
  const HttpRequest request = requests().at(0);
  EXPECT_EQ(request.method, "POST");
  EXPECT_EQ(request.timeout, std::nullopt);
  EXPECT_EQ(envelopeOf(request).find("postTime")->doubleValue(), platform.clock.wallSeconds());
  std::vector<std::string> lines;
  for (const auto& header : request.headers) lines.push_back(header.name + ": " + header.value);
  EXPECT_EQ(lines, (std::vector<std::string>{
                       "X-ORV-Client-Name: Mail", "X-ORV-Service-Name: 17", "X-ORV-Internal-Build: 1",
                       "User-Agent: Orvanta/4.2.1 (Parva3,2; 12.5)", "X-ORV-Client-Version: 42", "X-ORV-Sender: ZK",
                       "X-ORV-Event-Map: 65535 1", "Accept: application/json", "Content-Type: application/json",
                       "Content-Length: " + std::to_string(request.body.size()), "Content-Encoding: gzip"}));

  setup = {};
  setup.identity.productType.reset();
  setup.userInfo = shared({{"clientName", Array{"Mail"}}});
  send(*makeBackend(setup), 1);
  const HttpRequest bare = requests().at(1);
  EXPECT_EQ(bare.headers.at(0).name, "User-Agent") << "neither names nor the internal build";
  EXPECT_EQ(bare.headers.at(0).value, "Orvanta/8.0 ((null); 12.5)");
}

TEST_F(HTTPSPostRequestTest, GzipOnlyWhereItIsSmaller) {
  Array rules;
  for (const auto name : kReservedKeyNames) rules.emplace_back(Dictionary{{"key", name}, {"action", "remove"}});
  const auto backend = makeBackend(requiring({{"filters", rules}}));
  backend->setUserInfoDict(shared({}));
  send(*backend, 1);  // nothing but the envelope
  send(*backend, 1, 0, shared({{"filler", std::string(1000, 'x')}}));
  const auto posted = requests();
  EXPECT_EQ(headerOf(posted[0], "Content-Encoding"), "(absent)");
  EXPECT_EQ(posted[0].body.front(), '{');
  EXPECT_EQ(headerOf(posted[1], "Content-Encoding"), "gzip");
  for (const auto& post : posted) EXPECT_EQ(headerOf(post, "Content-Length"), std::to_string(post.body.size()));
}

TEST_F(HTTPSPostRequestTest, AnswersOfTheServer) {
  const auto nothing = makeOrvantaError("Nothing to flush", -1);
  const std::string disabled = "backend http_post disabled by server ";
  const std::tuple<HttpResult, std::optional<OrvantaError>, std::string> rows[] = {
      {ScriptedHttpClient::status(200), {}, ""},
      {ScriptedHttpClient::status(404), {}, ""},
      {ScriptedHttpClient::status(499), {}, ""},
      {ScriptedHttpClient::status(600), {}, ""},
      {ScriptedHttpClient::status(0), {}, ""},
      {ScriptedHttpClient::status(500), makeOrvantaError(disabled + "500 return code", 500), "<6>postJSONMessage: "},
      {ScriptedHttpClient::status(599), makeOrvantaError(disabled + "599 return code", 599), "<6>postJSONMessage: "},
      {{std::nullopt, "certificate has expired"},
       makeOrvantaError("certificate has expired", -1),
       "<3>HTTPSPostBackend(postJsonMessage): post error: "},
  };
  for (const auto& row : rows) {
    const auto& [result, error, line] = row;
    SCOPED_TRACE(result.response ? std::to_string(result.response->status) : result.error);
    platform.http.answer = [&row](const HttpRequest&) { return std::get<0>(row); };
    const LogCapture log;
    const auto backend = makeBackend(batching());
    send(*backend, 1);
    const FlushAnswer answer = flush(*backend);
    EXPECT_EQ(answer.calls, 1);
    EXPECT_EQ(answer.error, error);
    EXPECT_TRUE(!error || log.contains(line + error->description));
    EXPECT_EQ(flush(*backend).error, nothing) << "a failed post restores nothing";
    const bool disables = error && error->code >= 500;
    EXPECT_EQ(backend->state(), disables ? kBackendDisabled : kBackendEnabled);
    send(*backend, 2);
    EXPECT_EQ(flush(*backend).error == nothing, disables) << "events are dropped now";
    backend->updateState();
    EXPECT_EQ(backend->state(), kBackendEnabled) << "until the next evaluation";
  }
}

TEST_F(HTTPSPostRequestTest, APromotionDoesNotUndoTheServersAnswer) {
  // The server's answer arrives while the backend is held; a promoting event comes later.
  platform.http.hold = true;
  const auto backend = makeBackend({});
  send(*backend, 1);
  settle();
  backend->setState(kBackendHeld);
  ASSERT_TRUE(platform.http.finishHeld(ScriptedHttpClient::status(500)));
  send(*backend, 2, 2);
  EXPECT_EQ(backend->state(), kBackendDisabled);
  EXPECT_EQ(requests().size(), 1U);
}

TEST_F(HTTPSPostRequestTest, NoURL) {
  platform.device.consent = true;
  const auto backend = makeBackend(batching({{"post_url", nullptr}, {"realtime_post_url", nullptr}}));
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

TEST_F(HTTPSPostRequestTest, ADroppedPostIsReported) {
  // A client that loses a request without a word, as a pool does with jobs that it never ran.
  Pending pending;
  {
    TestBackends own;
    own.http.hold = true;
    const auto backend = makeBackend(batching(), own);
    Event event{.category = 1, .type = 1};
    backend->sendMessage(event);
    backend->flushMessagesWithCompletion(pending.completion());
    ASSERT_TRUE(own.services.pendingPosts->waitUntilSubmitted(kHangGuard));
    EXPECT_EQ(pending.answer->calls, 0);
  }
  EXPECT_EQ(pending.answer->calls, 1);
  EXPECT_TRUE(pending.answer->error);
}

TEST(PendingPostsTest, AllQueuesShareTheRoomAndFewMayWaitForIt) {
  using Reservation = PendingPosts::Reservation;
  const auto posts = std::make_shared<PendingPosts>();
  std::vector<std::shared_ptr<PendingPosts::QueueShare>> queues;
  std::vector<std::unique_ptr<Reservation>> places;
  for (int i = 0; i < 5; ++i) queues.push_back(std::make_shared<PendingPosts::QueueShare>());
  for (int i = 0; i < 4; ++i) {  // leaves the fifth no room, though it has nothing yet
    places.push_back(Reservation::take(posts, queues[i], PendingPosts::kMaximumTotalBytes / 4));
    ASSERT_NE(places.back(), nullptr);
  }
  std::atomic<int> refused = 0, admitted = 0;
  std::vector<std::future<std::unique_ptr<Reservation>>> waiting;
  for (std::size_t i = 0; i <= PendingPosts::kMaximumWaiters; ++i) {
    waiting.push_back(std::async(std::launch::async, [&, i] {
      auto place = Reservation::take(posts, queues[i % queues.size()], 1);
      ++(place ? admitted : refused);
      return place;
    }));
  }
  ASSERT_TRUE(eventually([&] { return refused == 1; }));
  EXPECT_EQ(admitted, 0);
  places[0]->giveRoomBack();
  ASSERT_TRUE(eventually([&] { return admitted > 0; }));
  posts->stopWaiting();
  for (auto& each : waiting) each.get();
  EXPECT_EQ(refused, 1);
  EXPECT_EQ(admitted, static_cast<int>(PendingPosts::kMaximumWaiters));
}

TEST_F(HTTPSPostRequestTest, WhoHasMoreThanMayWaitWaitsForRoomAndLosesNothing) {
  std::promise<void> release = holdCompressing();
  const auto backend = makeBackend(batching());
  Pending first, second;
  // A message of any size may wait alone; then there is room for none.
  send(*backend, 1, 0, shared({{"filler", std::string(PendingPosts::kMaximumQueueBytes + 1, 'x')}}));
  backend->flushMessagesWithCompletion(first.completion());
  Counter waiting;
  auto sender = std::async(std::launch::async, [&] {
    platform::BlockingScope::setBeforeBlocking({[](void* count) { static_cast<Counter*>(count)->add(); }, &waiting});
    send(*backend, 1);
    backend->flushMessagesWithCompletion(second.completion());
  });
  ASSERT_TRUE(waiting.waitFor(1)) << "in a BlockingScope";
  const auto other = std::async(std::launch::async, [&] { backend->setCorrelatedSessionID("root.own"); });
  EXPECT_EQ(other.wait_for(kHangGuard), std::future_status::ready) << "it waits with the backend's lock held";
  EXPECT_FALSE(platform.services.pendingPosts->waitUntilSubmitted(std::chrono::milliseconds(0)));
  release.set_value();
  sender.get();
  ASSERT_TRUE(first.wait() && second.wait());
  EXPECT_EQ(first.answer->error, std::nullopt);
  EXPECT_EQ(second.answer->error, std::nullopt);
  EXPECT_EQ(requests().size(), 2U);
}

}  // namespace
}  // namespace orvanta::test
