#include "tests/platform/HttpFixture.h"

namespace platform {
namespace {

using orvanta::test::RawConnection;
using orvanta::test::RawServer;

class HttpAnswerTest : public HttpFixture {
 protected:
  // The client's result when the server sends `answer` and closes the connection.
  HttpResult after(const std::string& answer, HttpRequest request = {}) {
    RawServer server([&](RawConnection& connection) {
      if (connection.readRequest()) connection.write(answer);
    });
    request.url = server.url();
    return perform(std::move(request));
  }
};

TEST_F(HttpAnswerTest, Bodies) {
  const std::string gzipped("\x1f\x8b\x08\0raw", 7);
  const struct {
    std::string answer;
    int status;
    std::string body;
  } rows[] = {
      {RawServer::response("200 OK", {}, "hello"), 200, "hello"},
      {"HTTP/1.1 200 OK\r\n\r\nuntil the end", 200, "until the end"},
      {"HTTP/1.0 404 Not Found\r\n\r\n", 404, ""},
      {"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n3\r\nabc\r\n2;x=y\r\nde\r\n0\r\nX-Trailer: 1\r\n\r\n", 200,
       "abcde"},
      {RawServer::response("200 OK", "Content-Encoding: gzip\r\n", gzipped), 200, gzipped},
      {"HTTP/1.1 100 Continue\r\n\r\nHTTP/1.1 103 Early Hints\r\nX-A: no\r\n\r\n" +
           RawServer::response("201 Made", {}, "x"),
       201, "x"},
      {"HTTP/1.1 204 No Content\r\n\r\n", 204, ""},
      {"HTTP/1.1 304 Not Modified\r\nContent-Length: 99\r\n\r\n", 304, ""},
      {RawServer::response("503 Gone Fishing", {}, "later"), 503, "later"},
      {RawServer::response("599 Odd", {}, {}), 599, ""},
      {RawServer::response("302 No Target", {}, "stay"), 302, "stay"},
  };
  for (const auto& row : rows) {
    const HttpResult result = after(row.answer);
    ASSERT_TRUE(result.response) << row.answer << ": " << result.error;
    EXPECT_EQ(result.response->status, row.status);
    EXPECT_EQ(result.response->body, row.body);
    EXPECT_EQ(result.response->header("X-A"), nullptr);
    EXPECT_EQ(result.response->header("X-Trailer"), nullptr);
    EXPECT_TRUE(result.error.empty());
  }
}

TEST_F(HttpAnswerTest, Headers) {
  const HttpResult result = after(RawServer::response(
      "200 OK",
      "Cache-Control:  max-age=600 \r\nlast-modified: Tue, 01 Jan 2030 00:00:00 GMT\r\nX-Empty:\r\nX-Twice: 1\r\n"
      "X-Twice: 2\r\nX-Folded: one\r\n   two\r\n"));
  ASSERT_TRUE(result.response) << result.error;
  const auto value = [&](const char* name) {
    const std::string* found = result.response->header(name);
    return found != nullptr ? *found : "(none)";
  };
  EXPECT_EQ(value("cache-control"), "max-age=600");
  EXPECT_EQ(value("Last-Modified"), "Tue, 01 Jan 2030 00:00:00 GMT");
  EXPECT_EQ(value("X-Empty"), "");
  EXPECT_EQ(value("X-Twice"), "1");
  EXPECT_EQ(value("X-Folded"), "one two");
  EXPECT_EQ(value("X-Twic"), "(none)");
}

TEST_F(HttpAnswerTest, ABodyNobodyWantsIsThrownAway) {
  HttpRequest request;
  request.discardResponseBody = true;
  const HttpResult result = after(RawServer::response("200 OK", "X-A: 1\r\n", std::string(100000, 'x')), request);
  ASSERT_TRUE(result.response) << result.error;
  EXPECT_TRUE(result.response->body.empty());
  EXPECT_NE(result.response->header("x-a"), nullptr);
}

TEST_F(HttpAnswerTest, BrokenAnswersAreErrors) {
  const struct {
    const char* what;
    std::string answer;
  } rows[] = {
      {"nothing", ""},
      {"not HTTP", "SSH-2.0-OpenSSH\r\n\r\n"},
      {"half a status line", "HTTP/1.1 20"},
      {"a header without a colon", "HTTP/1.1 200 OK\r\nnonsense\r\nContent-Length: 0\r\n\r\n"},
      {"a body cut short", "HTTP/1.1 200 OK\r\nContent-Length: 10\r\n\r\nabc"},
      {"a chunk cut short", "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\nff\r\nabc"},
      {"no last chunk", "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n3\r\nabc\r\n"},
      {"a chunk size that is none", "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\nzz\r\nabc\r\n0\r\n\r\n"},
      {"a negative length", "HTTP/1.1 200 OK\r\nContent-Length: -5\r\n\r\nabc"},
  };
  for (const auto& row : rows) {
    const HttpResult result = after(row.answer);
    EXPECT_FALSE(result.response) << row.what;
    EXPECT_FALSE(result.error.empty()) << row.what;
  }
}

TEST_F(HttpAnswerTest, ResetsAreErrors) {
  for (const std::string& answer : {std::string(), std::string("HTTP/1.1 200 OK\r\nContent-Length: 10\r\n\r\nabc")}) {
    RawServer server([&](RawConnection& connection) {
      if (!connection.readRequest()) return;
      connection.write(answer);
      connection.reset();
    });
    const HttpResult result = perform(post(server.url()));
    EXPECT_FALSE(result.response);
    EXPECT_FALSE(result.error.empty());
  }
}

TEST_F(HttpAnswerTest, EndlessAnswersAreCut) {
  HttpLimits limits;
  limits.responseBytes = 100'000;
  makeClient(limits);
  EXPECT_EQ(statusOf(after(RawServer::response("200 OK", {}, std::string(100'000, 'x')))), 200) << "just fits";
  EXPECT_TRUE(
      has(after(RawServer::response("200 OK", {}, std::string(100'001, 'x'))).error, "larger than 100000 bytes"));
  const struct {
    std::string begin, rest;
    const char* error;
  } rows[] = {
      {"HTTP/1.1 200 OK\r\n\r\n", std::string(1000, 'x'), "larger than 100000 bytes"},
      {"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n", "4\r\nabcd\r\n", "larger than 100000 bytes"},
      {"HTTP/1.1 200 OK\r\n", "X-Header: value\r\n", ""},
      {"", "HTTP/1.1 100 Continue\r\n\r\n", ""},
      {"HTTP/1.1 200 OK\r\nX-Long: ", "xxxxxxxxxx", ""},
  };
  for (const auto& row : rows) {
    for (const bool discard : {false, true}) {
      RawServer server([&](RawConnection& connection) {
        if (!connection.readRequest() || !connection.write(row.begin)) return;
        while (connection.write(row.rest)) {
        }
      });
      HttpRequest request = get(server.url());
      request.discardResponseBody = discard;
      const HttpResult result = perform(std::move(request));
      EXPECT_FALSE(result.response) << row.rest;
      EXPECT_FALSE(result.error.empty()) << row.rest;
      EXPECT_TRUE(has(result.error, row.error)) << result.error;
    }
  }
}

TEST_F(HttpAnswerTest, SilentServersAreGivenUp) {
  HttpLimits limits;
  limits.noProgress = std::chrono::seconds(1);
  makeClient(limits);
  for (const char* answer : {"", "HTTP/1.1 200 OK\r\nContent-Length: 10\r\n\r\nabc"}) {
    RawServer server([&](RawConnection& connection) {
      connection.readRequest();
      connection.write(answer);
      connection.waitForClose();
    });
    const HttpResult result = perform(get(server.url()));
    EXPECT_TRUE(has(result.error, "too slow")) << result.error;
  }
}

TEST_F(HttpAnswerTest, TimeoutsEndWhatTakesTooLong) {
  using std::chrono::milliseconds;
  RawServer silent([](RawConnection& connection) {
    connection.readRequest();
    connection.waitForClose();
  });
  // Progress all the time, so that only the request's own time can end it.
  RawServer dribbling([](RawConnection& connection) {
    connection.readRequest();
    connection.write("HTTP/1.1 200 OK\r\n\r\n");
    while (connection.write("x")) {
    }
  });
  RawServer redirecting([&](RawConnection& connection) {
    connection.readRequest();
    connection.write(RawServer::response("302 Found", "Location: " + silent.url() + "\r\n"));
  });
  HttpLimits limits;
  limits.responseBytes = std::size_t{1} << 40U;
  makeClient(limits);
  for (const RawServer* server : {&silent, &dribbling, &redirecting}) {
    HttpRequest request = within(milliseconds(200), get(server->url()));
    request.discardResponseBody = true;
    const HttpResult result = perform(std::move(request));
    EXPECT_FALSE(result.response);
    EXPECT_EQ(result.error, "Timed out after 200 ms, waiting for the answer");
  }
  EXPECT_TRUE(has(perform(within(milliseconds(-1), get(silent.url()))).error, "Timed out"));
  EXPECT_TRUE(has(perform(within(milliseconds(0), get(silent.url()))).error, "Timed out"));
}

}  // namespace
}  // namespace platform
