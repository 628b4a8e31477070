#include "tools/collector/HttpMessage.h"

#include <gmock/gmock.h>

#include "tools/collector/RelayConnection.h"

namespace orvanta::collector {
namespace {

TEST(HttpMessageTest, ReadsRequestHeads) {
  const auto good = parseRequestHead("POST /a%20b?x=%31 HTTP/1.0\r\nA:1\r\nb:\t2 \r\nConnection: Keep-Alive\r\n\r\n");
  ASSERT_TRUE(good) << good.error();
  EXPECT_EQ(good->method, "POST");
  EXPECT_EQ(good->target, "/a%20b?x=%31");
  EXPECT_EQ(*findHeader(good->headers, "B"), "2");
  EXPECT_TRUE(good->keepsAlive());
  EXPECT_FALSE(parseRequestHead("GET / HTTP/1.0\r\n\r\n")->keepsAlive());
  EXPECT_TRUE(parseRequestHead("GET / HTTP/1.1\r\n\r\n")->keepsAlive());
  EXPECT_FALSE(parseRequestHead("GET / HTTP/1.1\r\nconnection: CLOSE\r\n\r\n")->keepsAlive());
  EXPECT_TRUE(parseRequestHead("PUT / HTTP/1.1\r\nExpect: 100-Continue\r\n\r\n")->expectsContinue());
}

TEST(HttpMessageTest, RefusesDamagedHeads) {
  for (const char* head : {"", "\r\n\r\n", "GET /\r\n\r\n", "GET  HTTP/1.1\r\n\r\n", " / HTTP/1.1\r\n\r\n",
                           "GET / HTTP/2\r\n\r\n", "GET / a HTTP/1.1\r\n\r\n", "GET / HTTP/1.1\r\nA: 1",
                           "GET / HTTP/1.1\r\n a: 2\r\n\r\n", "GET / HTTP/1.1\r\nA 1\r\n\r\n",
                           "GET / HTTP/1.1\r\n: 1\r\n\r\n", "GET / HTTP/1.1\r\nA b: 1\r\n\r\n", "GET / HTTP/1.1"}) {
    EXPECT_FALSE(parseRequestHead(head)) << head;
  }
  for (const char* head :
       {"", "HTTP/1.1\r\n\r\n", "HTTP/1.1 2x0 OK\r\n\r\n", "HTTP/2 200 OK\r\n\r\n", "HTTP/1.1 200 OK\r\nA\r\n\r\n"}) {
    EXPECT_FALSE(parseResponseHead(head)) << head;
  }
  EXPECT_EQ(parseResponseHead("HTTP/1.1 304 Not Modified\r\n\r\n")->status, 304);
}

TEST(HttpMessageTest, ReadsLengths) {
  const auto length = [](const std::string& lines) {
    return parseRequestHead("POST / HTTP/1.1\r\n" + lines + "\r\n")->contentLength();
  };
  EXPECT_EQ(length("")->value_or(99), 99U);
  EXPECT_EQ(length("content-length: 12\r\n")->value_or(99), 12U);
  EXPECT_EQ(length("Content-Length: 3\r\nContent-Length: 3\r\n")->value_or(99), 3U);
  for (const char* lines :
       {"Content-Length: -1\r\n", "Content-Length:\r\n", "Content-Length: 1 2\r\n", "Content-Length: 0x1\r\n",
        "Content-Length: 99999999999999999999\r\n", "Content-Length: 3\r\nContent-Length: 4\r\n"}) {
    EXPECT_FALSE(length(lines)) << lines;
  }
  EXPECT_EQ(parseChunkSize("1a"), 26U);
  EXPECT_EQ(parseChunkSize("0 ;name=value"), 0U);
  for (const char* line : {"", ";x", "g", "1 2", "-1", "10000000000000000"}) EXPECT_FALSE(parseChunkSize(line)) << line;
}

TEST(HttpMessageTest, TakesTargetsApart) {
  EXPECT_EQ(pathOfTarget("/a%2Fb%zz%4?c%20d"), "/a/b%zz%4");
  EXPECT_EQ(queryParameter("/u?a=1&b=%C3%A9%20&c", "b"), "é ");
  EXPECT_EQ(queryParameter("/u?aa=1&a=b=c&&a=2&d", "a"), "b=c");
  EXPECT_EQ(queryParameter("/u?aa=1&d", "d"), "");
  EXPECT_EQ(queryParameter("/u?aa=1", "a"), std::nullopt);
}

}  // namespace
}  // namespace orvanta::collector
