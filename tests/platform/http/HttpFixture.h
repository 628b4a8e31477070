#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/http/HttpClient.h"
#include "platform/queue/WorkQueue.h"
#include "tests/support/LogCapture.h"
#include "tests/support/RawServer.h"

namespace orvanta::platform {

using orvanta::test::LogCapture;
using orvanta::test::RawConnection;
using orvanta::test::RawServer;

// A real client with a pool of its own.
class HttpFixture : public testing::Test {
 protected:
  using Headers = std::vector<HttpHeader>;

  HttpFixture() {
    _pool.start();
    makeClient();
  }

  void makeClient(HttpLimits limits = {}, std::string caFile = {}) {
    _client = makeCurlHttpClient(_pool, {std::move(caFile), limits});
  }
  HttpClient& client() { return *_client; }

  static HttpRequest get(std::string url, Headers headers = {}) {
    return {"GET", std::move(url), std::move(headers), {}, {}, false};
  }
  static HttpRequest post(std::string url, std::string body = "body", Headers headers = {}) {
    return {"POST", std::move(url), std::move(headers), std::move(body), {}, false};
  }
  static HttpRequest within(std::chrono::milliseconds timeout, HttpRequest request) {
    request.timeout = timeout;
    return request;
  }

  // In a lane of its own.
  HttpResult perform(HttpRequest request) { return client().perform(client().makeLane(), std::move(request)); }
  std::future<HttpResult> start(const std::shared_ptr<HttpLane>& lane, HttpRequest request) {
    auto promise = std::make_shared<std::promise<HttpResult>>();
    client().start(lane, std::move(request), {},
                   [promise](HttpResult result) { promise->set_value(std::move(result)); });
    return promise->get_future();
  }
  // A result that must come.
  static HttpResult await(std::future<HttpResult>& future) {
    if (future.wait_for(std::chrono::seconds(30)) != std::future_status::ready) {
      ADD_FAILURE() << "no result";
      return {};
    }
    return future.get();
  }

  // An error whose text holds that part.
  static void expectError(const HttpResult& result, const std::string& part = {}) {
    EXPECT_FALSE(result.response);
    EXPECT_FALSE(result.error.empty());
    EXPECT_TRUE(has(result.error, part)) << result.error;
  }
  static RawServer::Script answering(std::string_view status) {
    return RawServer::answering(RawServer::response(status));
  }
  static void beSilent(RawConnection& connection) {
    connection.readRequest();
    connection.waitForClose();
  }
  static int statusOf(const HttpResult& result) { return result.response ? result.response->status : -1; }
  static bool has(const std::string& text, const std::string& part) { return text.find(part) != std::string::npos; }

  WorkPool _pool{2};
  std::unique_ptr<HttpClient> _client;
};

}  // namespace orvanta::platform
