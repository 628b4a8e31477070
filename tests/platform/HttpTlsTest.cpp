#include <httplib.h>

#include <atomic>
#include <thread>

#include "tests/platform/HttpFixture.h"
#include "tests/support/TemporaryDirectory.h"
#include "tools/collector/Certificates.h"

namespace platform {
namespace {

using orvanta::collector::CertificateAuthority;
using orvanta::collector::CertificateFlaw;
using orvanta::test::TemporaryDirectory;

// An https server on the loopback interface, with a certificate of `authority`, that counts what reaches it.
class TlsServer {
 public:
  explicit TlsServer(const CertificateAuthority& authority, CertificateFlaw flaw = CertificateFlaw::none,
                     const std::string& redirectTo = {}) {
    const auto identity = authority.issueServerIdentity(flaw).value();
    _server.emplace(_directory.write("server.pem", identity.certificatePem).c_str(),
                    _directory.write("server.key", identity.keyPem).c_str());
    _server->new_task_queue = [] { return new httplib::ThreadPool(8); };
    _server->set_keep_alive_max_count(1);  // or stop() would wait for kept connections
    const auto answer = [this, redirectTo](const httplib::Request& request, httplib::Response& response) {
      ++_received;
      if (redirectTo.empty()) return response.set_content("got " + request.body, "text/plain");
      response.set_redirect(redirectTo, 307);
    };
    _server->Get("/", answer).Post("/", answer);
    _port = _server->bind_to_any_port("127.0.0.1");
    _thread = std::thread([this] { _server->listen_after_bind(); });
    while (!_server->is_running()) std::this_thread::yield();  // before that, stop() has no effect
  }
  ~TlsServer() {
    _server->stop();
    _thread.join();
  }
  std::string url(const std::string& host = "localhost") const {
    return "https://" + host + ":" + std::to_string(_port) + "/";
  }
  int received() const { return _received; }

 private:
  const TemporaryDirectory _directory;
  std::optional<httplib::SSLServer> _server;
  std::atomic<int> _received{0};
  int _port = 0;
  std::thread _thread;
};

class HttpTlsTest : public HttpFixture {
 protected:
  TemporaryDirectory _directory;
  const CertificateAuthority _authority = CertificateAuthority::readOrMake(_directory.path()).value();
};

TEST_F(HttpTlsTest, TrustedServersAreServed) {
  const TlsServer server(_authority);
  makeClient({}, _authority.certificateFile());
  for (const char* host : {"localhost", "127.0.0.1"}) {
    const HttpResult result = perform(post(server.url(host), "payload"));
    ASSERT_TRUE(result.response) << result.error;
    EXPECT_EQ(result.response->body, "got payload");
  }
}

TEST_F(HttpTlsTest, DoubtfulServersGetNothing) {
  const std::pair<CertificateFlaw, const char*> rows[] = {
      {CertificateFlaw::wrongHost, "no alternative certificate subject name matches"},
      {CertificateFlaw::expired, "certificate has expired"},
      {CertificateFlaw::selfSigned, "self-signed certificate"},
  };
  makeClient({}, _authority.certificateFile());
  for (const auto& [flaw, reason] : rows) {
    const TlsServer server(_authority, flaw);
    expectError(perform(post(server.url(), "payload")), reason);
    EXPECT_EQ(server.received(), 0) << reason;
  }
}

TEST_F(HttpTlsTest, TheSystemsStoreAndACaFileExcludeEachOther) {
  const TlsServer server(_authority);
  makeClient();
  expectError(perform(get(server.url())), "unable to get local issuer certificate");
  const TemporaryDirectory elsewhere;
  makeClient({}, CertificateAuthority::readOrMake(elsewhere.path()).value().certificateFile());
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
  const TlsServer target(_authority);
  const TlsServer leaking(_authority, CertificateFlaw::none, open.url());
  RawServer upgrading(RawServer::answering(RawServer::response("308 Secure", "Location: " + target.url() + "\r\n")));
  RawServer detour(RawServer::answering(RawServer::response("307 Detour", "Location: " + leaking.url() + "\r\n")));
  makeClient({}, _authority.certificateFile());
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
