#include <fmt/format.h>

#include "tests/platform/http/HttpFixture.h"

namespace orvanta::platform {
namespace {

class HttpMessageTest : public HttpFixture {
 protected:
  // The bytes on the wire for `request`, and the log lines about it.
  std::string sent(HttpRequest request) {
    const std::size_t before = _server.requests().size();
    const HttpResult result = perform(std::move(request));
    EXPECT_EQ(statusOf(result), 200) << result.error;
    const auto requests = _server.requests();
    return requests.size() == before + 1 ? requests.back() : "";
  }
  std::string host() const { return fmt::format("Host: 127.0.0.1:{}\r\n", _server.port()); }

  RawServer _server{answering("200 OK")};
  LogCapture _log;
};

TEST_F(HttpMessageTest, NothingIsAddedButHostAndTheLength) {
  const std::string large(3U << 20U, 'b');  // without Expect
  EXPECT_EQ(sent(get(_server.url("/a?b=c"))), "GET /a?b=c HTTP/1.1\r\n" + host() + "\r\n");
  for (const std::string& body : {std::string(), std::string("a\0b\n", 4), large}) {
    EXPECT_EQ(sent(post(_server.url("/"), body)),
              "POST / HTTP/1.1\r\n" + host() + fmt::format("Content-Length: {}\r\n\r\n", body.size()) + body);
  }
  EXPECT_EQ(sent(get(_server.url(), {{"X-A", "1"}, {"Host", "example.org"}})),
            "GET / HTTP/1.1\r\nHost: example.org\r\nX-A: 1\r\n\r\n");
}

TEST_F(HttpMessageTest, HeadersThatWouldBreakTheMessageAreLeftOutWithAWarning) {
  const auto sentWith = [&](const HttpHeader& header) {
    _log.clear();
    return sent(get(_server.url(), {{"X-First", "1"}, header, {"X-Last", "2"}}));
  };
  const auto request = [&](const std::string& middle) {
    return "GET / HTTP/1.1\r\n" + host() + "X-First: 1\r\n" + middle + "X-Last: 2\r\n\r\n";
  };
  for (const HttpHeader& header :
       Headers{{"X-A", "gr\xc3\xbc\xc3\x9f"}, {"X-A", "a;b: c, \"d\""}, {"Connection", "close"}}) {
    EXPECT_EQ(sentWith(header), request(header.name + ": " + header.value + "\r\n"));
    EXPECT_TRUE(_log.lines().empty());
  }
  for (const char* blank : {"", "   "}) EXPECT_EQ(sentWith({"X-A", blank}), request("X-A:\r\n"));
  const Headers leftOut{{"X-A", "a\r\nX-Evil: 1"},  {"X-A", std::string("a\0b", 3)},
                        {"X-A", "a\x7f"},           {"", "value"},
                        {"X A", "value"},           {"X-A:", "value"},
                        {"X-A\r\nX-Evil", "value"}, {"Transfer-Encoding", "chunked"},
                        {"expect", "100-continue"}};
  for (const HttpHeader& header : leftOut) {
    EXPECT_EQ(sentWith(header), request("")) << header.name;
    EXPECT_EQ(_log.count("<4>HttpClient: Header "), 1U) << header.name;
  }
}

TEST_F(HttpMessageTest, ContentLengthIsTrueEvenIfTheCallerSaysOtherwise) {
  const struct {
    Headers headers;
    std::string expected;
  } rows[] = {
      {{{"Content-Length", "999"}, {"X-A", "1"}}, "Content-Length: 4\r\nX-A: 1\r\n"},
      {{{"content-length", ""}, {"X-A", "1"}, {"Content-Length", "7"}}, "content-length: 4\r\nX-A: 1\r\n"},
      {{{"X-A", "1"}}, "X-A: 1\r\nContent-Length: 4\r\n"},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(sent(post(_server.url(), "body", row.headers)),
              "POST / HTTP/1.1\r\n" + host() + row.expected + "\r\nbody");
  }
  EXPECT_EQ(sent(get(_server.url(), {{"Content-Length", "5"}})), "GET / HTTP/1.1\r\n" + host() + "\r\n");
}

// The handle and the connection are used again; nothing of one request may show in the next.
TEST_F(HttpMessageTest, RequestsDoNotMixOnOneConnection) {
  const auto lane = client().makeLane();
  const auto run = [&](HttpRequest request) { EXPECT_EQ(statusOf(client().perform(lane, std::move(request))), 200); };
  run(post(_server.url("/1"), "first", {{"X-A", "1"}, {"Content-Type", "text/plain"}}));
  run(get(_server.url("/2")));
  run(post(_server.url("/3"), "third"));
  const auto requests = _server.requests();
  ASSERT_EQ(requests.size(), 3U);
  EXPECT_EQ(requests[1], "GET /2 HTTP/1.1\r\n" + host() + "\r\n");
  EXPECT_EQ(requests[2], "POST /3 HTTP/1.1\r\n" + host() + "Content-Length: 5\r\n\r\nthird");
  EXPECT_EQ(_server.connectionCount(), 1U);
}

// A server may close a kept connection at any moment; the next request then takes a new one.
TEST_F(HttpMessageTest, AKeptConnectionThatWasClosedIsReplaced) {
  RawServer once([](RawConnection& connection) {
    connection.readRequest();
    connection.write(RawServer::response("200 OK"));
  });
  const auto lane = client().makeLane();
  for (int i = 0; i < 5; ++i) EXPECT_EQ(statusOf(client().perform(lane, post(once.url()))), 200);
  EXPECT_EQ(once.requests().size(), 5U);
}

TEST_F(HttpMessageTest, RefusesWhatCannotBeSent) {
  const std::pair<const char*, std::vector<std::string>> rows[] = {
      {"neither http nor https", {"", "127.0.0.1/x", "file:///etc/passwd", "httpx://127.0.0.1/"}},
      {"Malformed URL", {_server.url("/a b"), _server.url(std::string("/a\0b", 4)), _server.url("/a\r\nX-Evil: 1")}},
      {"connect", {"http://127.0.0.1:1/"}},
      {"", {"http://", "http:///path", "http://127.0.0.1:99999/", "http://name.invalid./"}},
  };
  for (const auto& [error, urls] : rows) {
    for (const std::string& url : urls) {
      SCOPED_TRACE(url);
      expectError(perform(get(url)), error);
    }
  }
  HttpRequest request = get(_server.url());
  request.method = "get";
  expectError(perform(std::move(request)), "Unsupported method get");
  EXPECT_TRUE(_server.requests().empty());
}

}  // namespace
}  // namespace orvanta::platform
