#include "platform/http/HttpRedirect.h"

#include "tests/platform/http/HttpFixture.h"

namespace orvanta::platform {
namespace {

TEST(HttpRedirectVerdict, Table) {
  using enum RedirectVerdict;
  const struct {
    const char* method;
    const char* url;
    std::vector<int> statuses;
    const char* target;
    int followed;
    RedirectVerdict expected;
  } rows[] = {
      {"GET", "http://a/", {301, 302, 303, 307, 308}, "http://b/", 0, follow},
      {"GET", "http://a/", {302}, "https://b/", 4, follow},
      {"GET", "https://a/", {303}, "HTTPS://b/", 0, follow},
      {"GET", "http://a/", {200, 201, 300, 304, 305}, "http://b/", 0, answer},
      {"GET", "http://a/", {302}, "", 0, answer},
      {"GET", "http://a/", {302}, "http://b/", 5, tooMany},
      {"GET", "https://a/", {302}, "http://b/", 0, insecure},
      {"GET", "HTTPS://a/", {302}, "http://b/", 0, insecure},
      {"GET", "http://a/", {302}, "ftp://b/", 0, unsupported},
      {"GET", "http://a/", {302}, "file:///etc/passwd", 0, unsupported},
      {"GET", "http://a/", {302}, "garbage", 0, unsupported},
      {"POST", "http://a/", {301, 302, 303}, "http://b/", 0, answer},
      {"POST", "http://a/", {307, 308}, "https://b/", 4, follow},
      {"POST", "http://a/", {307}, "http://b/", 5, tooMany},
      {"POST", "https://a/", {307}, "http://b/", 0, insecure},
  };
  for (const auto& row : rows) {
    for (const int status : row.statuses) {
      const HttpRedirect redirect{row.method, row.url, status, row.target, row.followed, 5};
      const RedirectVerdict verdict = judgeRedirect(redirect);
      EXPECT_EQ(verdict, row.expected) << row.method << ' ' << row.url << ' ' << status << ' ' << row.target;
      EXPECT_EQ(describeRefusal(verdict, redirect).empty(), verdict == answer || verdict == follow);
    }
  }
}

class HttpRedirectTest : public HttpFixture {
 protected:
  static std::string redirect(int status, const std::string& target) {
    return RawServer::response(std::to_string(status) + " Elsewhere", "Location: " + target + "\r\n", "redirect");
  }
  RawServer _final{RawServer::answering(RawServer::response("200 OK", "X-Final: 1\r\n", "there"))};
};

TEST_F(HttpRedirectTest, GetsAreFollowedAndPostsRepeatedWhole) {
  for (const int status : {301, 302, 303, 307, 308}) {
    for (const bool posting : {false, true}) {
      RawServer first(RawServer::answering(redirect(status, _final.url("/x"))));
      const std::size_t before = _final.requests().size();
      const Headers headers{{"X-A", "1"}, {"Authorization", "secret"}, {"Cookie", "c"}, {"Content-Length", "4"}};
      const HttpResult result = perform(posting ? post(first.url(), "body", headers) : get(first.url(), headers));
      ASSERT_TRUE(result.response) << result.error;
      const auto requests = _final.requests();
      if (posting && status < 307) {
        EXPECT_EQ(result.response->status, status);
        EXPECT_EQ(result.response->body, "redirect");
        EXPECT_EQ(requests.size(), before);
        continue;
      }
      EXPECT_EQ(result.response->status, 200);
      EXPECT_EQ(result.response->body, "there");
      EXPECT_EQ(result.response->header("Location"), nullptr);
      ASSERT_EQ(requests.size(), before + 1);
      const std::string host = "Host: 127.0.0.1:" + std::to_string(_final.port()) + "\r\nX-A: 1\r\n";
      EXPECT_EQ(requests.back(), posting ? "POST /x HTTP/1.1\r\n" + host + "Content-Length: 4\r\n\r\nbody"
                                         : "GET /x HTTP/1.1\r\n" + host + "\r\n");
    }
  }
}

// Each answer sends one step further: /5 -> /4 -> ... -> /0.
TEST_F(HttpRedirectTest, FiveAreFollowedAndNoMoreAndNoOtherProtocol) {
  RawServer chain([](RawConnection& connection) {
    while (const auto request = connection.readRequest()) {
      const int left = request->at(5) - '0';
      connection.write(left == 0 ? RawServer::response("200 OK") : redirect(302, "/" + std::to_string(left - 1)));
    }
  });
  EXPECT_EQ(statusOf(perform(get(chain.url("/5")))), 200);
  EXPECT_EQ(perform(get(chain.url("/6"))).error, "More than 5 redirects");
  EXPECT_EQ(chain.requests().size(), 12U);
  RawServer elsewhere(RawServer::answering(redirect(302, "file:///etc/passwd")));
  expectError(perform(get(elsewhere.url())), "neither http nor https");
}

}  // namespace
}  // namespace orvanta::platform
