#include <httplib.h>

#include <atomic>
#include <thread>

#include "tests/platform/HttpFixture.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/TestCertificates.h"

namespace platform {
namespace {

using orvanta::test::TemporaryDirectory;
using orvanta::test::TestAuthority;
using orvanta::test::TestIdentity;

// An https server on the loopback interface that counts what reaches it.
class TlsServer {
 public:
  explicit TlsServer(const TestIdentity& identity, const std::string& redirectTo = {})
      : _server(identity.certificateFile.c_str(), identity.keyFile.c_str()) {
    _server.new_task_queue = [] { return new httplib::ThreadPool(8); };
    _server.set_keep_alive_max_count(1);  // or stop() would wait for kept connections
    _server.set_pre_routing_handler([this](const httplib::Request&, httplib::Response&) {
      ++_received;
      return httplib::Server::HandlerResponse::Unhandled;
    });
    const auto answer = [redirectTo](const httplib::Request& request, httplib::Response& response) {
      if (redirectTo.empty()) return response.set_content("got " + request.body, "text/plain");
      response.set_redirect(redirectTo, 307);
    };
    _server.Get("/", answer);
    _server.Post("/", answer);
    _port = _server.bind_to_any_port("127.0.0.1");
    _thread = std::thread([this] { _server.listen_after_bind(); });
    while (!_server.is_running()) std::this_thread::yield();  // before that, stop() has no effect
  }
  ~TlsServer() {
    _server.stop();
    _thread.join();
  }
  std::string url(const std::string& host = "localhost") const {
    return "https://" + host + ":" + std::to_string(_port) + "/";
  }
  int received() const { return _received; }

 private:
  httplib::SSLServer _server;
  std::atomic<int> _received{0};
  int _port = 0;
  std::thread _thread;
};

class HttpTlsTest : public HttpFixture {
 protected:
  TemporaryDirectory _directory;
  TestAuthority _authority{_directory.path()};
};

TEST_F(HttpTlsTest, TrustedServersAreServed) {
  const TlsServer server(_authority.issue());
  makeClient({}, _authority.file());
  for (const char* host : {"localhost", "127.0.0.1"}) {
    const HttpResult result = perform(post(server.url(host), "payload"));
    ASSERT_TRUE(result.response) << result.error;
    EXPECT_EQ(result.response->body, "got payload");
  }
}

TEST_F(HttpTlsTest, DoubtfulServersGetNothing) {
  const struct {
    TestIdentity identity;
    const char* reason;
  } rows[] = {
      {_authority.issue("DNS:example.org"), "no alternative certificate subject name matches"},
      {_authority.issue("DNS:localhost", -7200, -3600), "certificate has expired"},
      {_authority.issue("DNS:localhost", 3600, 7200), "certificate is not yet valid"},
      {_authority.selfSigned("DNS:localhost"), "self-signed certificate"},
  };
  makeClient({}, _authority.file());
  for (const auto& row : rows) {
    const TlsServer server(row.identity);
    expectError(perform(post(server.url(), "payload")), row.reason);
    EXPECT_EQ(server.received(), 0) << row.reason;
  }
}

TEST_F(HttpTlsTest, TheSystemsStoreAndACaFileExcludeEachOther) {
  const TlsServer server(_authority.issue());
  makeClient();
  expectError(perform(get(server.url())), "unable to get local issuer certificate");
  TemporaryDirectory elsewhere;
  TestAuthority stranger(elsewhere.path());
  makeClient({}, stranger.file());
  expectError(perform(get(server.url())));
  makeClient({}, elsewhere / "missing.pem");
  expectError(perform(get(server.url())), elsewhere / "missing.pem");
  EXPECT_EQ(server.received(), 0);
}

TEST_F(HttpTlsTest, APlainServerBehindHttpsIsAnError) {
  RawServer plain([](RawConnection& connection) {
    connection.write(RawServer::response("400 This Is Plain"));
    connection.waitForClose();
  });
  expectError(perform(post("https://127.0.0.1:" + std::to_string(plain.port()) + "/")));
}

TEST_F(HttpTlsTest, RedirectsGoFromHttpToHttpsAndNeverBack) {
  RawServer open(answering("200 OK"));
  const TlsServer target(_authority.issue());
  const TlsServer leaking(_authority.issue(), open.url());
  RawServer upgrading(RawServer::answering(RawServer::response("308 Secure", "Location: " + target.url() + "\r\n")));
  RawServer detour(RawServer::answering(RawServer::response("307 Detour", "Location: " + leaking.url() + "\r\n")));
  makeClient({}, _authority.file());
  const HttpResult upgraded = perform(post(upgrading.url(), "payload"));
  ASSERT_TRUE(upgraded.response) << upgraded.error;
  EXPECT_EQ(upgraded.response->body, "got payload");
  for (const std::string& url : {leaking.url(), detour.url()}) {
    EXPECT_EQ(perform(post(url, "payload")).error, "Redirect from https to " + open.url() + " refused");
  }
  EXPECT_EQ(open.connectionCount(), 0U);
}

}  // namespace
}  // namespace platform
