#include "tests/platform/http/HttpFixture.h"

namespace orvanta::platform {
namespace {

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
      {"HTTP/1.1 200 OK\r\n\r\nuntil the end", 200, "until the end"},
      {"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n3\r\nabc\r\n2;x=y\r\nde\r\n0\r\nX-Trailer: 1\r\n\r\n", 200,
       "abcde"},
      {RawServer::response("200 OK", "Content-Encoding: gzip\r\n", gzipped), 200, gzipped},
      {"HTTP/1.1 103 Early Hints\r\nX-A: no\r\n\r\n" + RawServer::response("201 Made", {}, "x"), 201, "x"},
      {"HTTP/1.1 304 Not Modified\r\nContent-Length: 99\r\n\r\n", 304, ""},
      {RawServer::response("302 No Target", {}, "stay"), 302, "stay"},
      {RawServer::response("599 Odd", {}, "later"), 599, "later"},
  };
  for (const auto& row : rows) {
    for (const bool discard : {false, true}) {
      HttpRequest request;
      request.discardResponseBody = discard;
      const HttpResult result = after(row.answer, request);
      ASSERT_TRUE(result.response) << row.answer << ": " << result.error;
      EXPECT_EQ(result.response->status, row.status);
      EXPECT_EQ(result.response->body, discard ? "" : row.body);
      EXPECT_EQ(result.response->header("X-A"), nullptr);
      EXPECT_EQ(result.response->header("X-Trailer"), nullptr);
      EXPECT_TRUE(result.error.empty());
    }
  }
}

TEST_F(HttpAnswerTest, Headers) {
  const HttpResult result =
      after(RawServer::response("200 OK",
                                "Cache-Control:  max-age=600 \r\nlast-modified: Tue\r\nX-Empty:\r\nX-Twice: 1\r\n"
                                "X-Twice: 2\r\nX-Folded: one\r\n   two\r\n"));
  ASSERT_TRUE(result.response) << result.error;
  const std::pair<const char*, const char*> rows[] = {{"cache-control", "max-age=600"},
                                                      {"Last-Modified", "Tue"},
                                                      {"X-Empty", ""},
                                                      {"X-Twice", "1"},
                                                      {"X-Folded", "one two"}};
  for (const auto& [name, value] : rows) {
    ASSERT_NE(result.response->header(name), nullptr) << name;
    EXPECT_EQ(*result.response->header(name), value) << name;
  }
  EXPECT_EQ(result.response->header("X-Twic"), nullptr);
}

TEST_F(HttpAnswerTest, BrokenAnswersAreErrors) {
  const std::string answers[] = {
      "",
      "SSH-2.0-OpenSSH\r\n\r\n",
      "HTTP/1.1 200 OK\r\nnonsense\r\nContent-Length: 0\r\n\r\n",
      "HTTP/1.1 200 OK\r\nContent-Length: 10\r\n\r\nabc",
      "HTTP/1.1 200 OK\r\nContent-Length: -5\r\n\r\nabc",
      "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\nff\r\nabc",
      "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n3\r\nabc\r\n",
      "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\nzz\r\nabc\r\n0\r\n\r\n",
  };
  for (const std::string& answer : answers) {
    SCOPED_TRACE(answer);
    expectError(after(answer));
  }
}

TEST_F(HttpAnswerTest, EndlessAnswersAreCut) {
  HttpLimits limits;
  limits.responseBytes = 100'000;
  makeClient(limits);
  EXPECT_EQ(statusOf(after(RawServer::response("200 OK", {}, std::string(100'000, 'x')))), 200) << "just fits";
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
        while (connection.write(row.rest)) continue;
      });
      HttpRequest request = get(server.url());
      request.discardResponseBody = discard;
      expectError(perform(std::move(request)), row.error);
    }
  }
}

TEST_F(HttpAnswerTest, SilentServersAreGivenUp) {
  HttpLimits limits;
  limits.noProgress = std::chrono::seconds(1);
  makeClient(limits);
  RawServer server([](RawConnection& connection) {
    connection.readRequest();
    connection.write("HTTP/1.1 200 OK\r\nContent-Length: 10\r\n\r\nabc");
    connection.waitForClose();
  });
  expectError(perform(get(server.url())), "too slow");
}

TEST_F(HttpAnswerTest, TimeoutsEndWhatTakesTooLong) {
  using std::chrono::milliseconds;
  RawServer silent(beSilent);
  // Progress all the time, so that only the request's own time can end it.
  RawServer dribbling([](RawConnection& connection) {
    connection.readRequest();
    connection.write("HTTP/1.1 200 OK\r\n\r\n");
    while (connection.write("x")) continue;
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
    expectError(perform(std::move(request)), "Timed out after 200 ms, waiting for the answer");
  }
  for (const int timeout : {-1, 0}) expectError(perform(within(milliseconds(timeout), get(silent.url()))), "Timed out");
}

}  // namespace
}  // namespace orvanta::platform
