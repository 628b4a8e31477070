#include "tests/platform/http/HttpFixture.h"
#include "tests/support/TemporaryDirectory.h"
#include "tools/collector/Collector.h"
#include "tools/collector/wire/Tls.h"

namespace orvanta::platform {
namespace {

using orvanta::collector::CertificateFlaw;
using orvanta::collector::Collector;
using orvanta::collector::PathBehaviour;
using orvanta::test::TemporaryDirectory;

class HttpTlsTest : public HttpFixture {
 protected:
  // An https server with a certificate of the authority that is in the directory. Its "/leak" redirects to
  // `redirectTo`.
  std::unique_ptr<Collector> startServer(CertificateFlaw flaw = CertificateFlaw::none,
                                         const std::string& redirectTo = {}) {
    orvanta::collector::CollectorOptions options;
    options.directory = _directory.path();
    options.certificateFlaw = flaw;
    auto started = Collector::start(std::move(options));
    auto server = std::move(started.value());
    PathBehaviour ok, redirect;
    ok.body = "got it";
    server->setBehaviour("/ok", ok);
    redirect.status = 307;
    redirect.headers = {{"Location", redirectTo}};
    server->setBehaviour("/leak", redirect);
    return server;
  }

  TemporaryDirectory _directory;
};

TEST_F(HttpTlsTest, TrustedServersAreServed) {
  const auto server = startServer();
  makeClient({}, server->caFile());
  for (const std::string& url :
       {server->httpsURL("/ok"), "https://127.0.0.1:" + std::to_string(server->httpsPort()) + "/ok"}) {
    const HttpResult result = perform(post(url, "payload"));
    ASSERT_TRUE(result.response) << result.error;
    EXPECT_EQ(result.response->body, "got it");
  }
}

TEST_F(HttpTlsTest, DoubtfulServersGetNothing) {
  const std::pair<CertificateFlaw, const char*> rows[] = {
      {CertificateFlaw::wrongHost, "no alternative certificate subject name matches"},
      {CertificateFlaw::expired, "certificate has expired"},
      {CertificateFlaw::selfSigned, "self-signed certificate"},
  };
  for (const auto& [flaw, reason] : rows) {
    const auto server = startServer(flaw);
    makeClient({}, server->caFile());
    expectError(perform(post(server->httpsURL("/ok"), "payload")), reason);
    EXPECT_TRUE(server->requests().empty()) << reason;
  }
}

TEST_F(HttpTlsTest, TheSystemsStoreAndACaFileExcludeEachOther) {
  const auto server = startServer();
  makeClient();
  expectError(perform(get(server->httpsURL("/ok"))), "unable to get local issuer certificate");
  const TemporaryDirectory elsewhere;
  const auto stranger = orvanta::collector::CertificateAuthority::readOrMake(elsewhere.path());
  for (const auto& [caFile, error] : {std::pair(stranger.value().certificateFile(), std::string()),
                                      std::pair(elsewhere / "missing.pem", elsewhere / "missing.pem")}) {
    makeClient({}, caFile);
    expectError(perform(get(server->httpsURL("/ok"))), error);
  }
  EXPECT_TRUE(server->requests().empty());
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
  const auto server = startServer(CertificateFlaw::none, open.url());
  const auto redirecting = [&](const std::string& path) {
    return RawServer::answering(RawServer::response("307 There", "Location: " + server->httpsURL(path) + "\r\n"));
  };
  RawServer upgrading(redirecting("/ok")), detour(redirecting("/leak"));
  makeClient({}, server->caFile());
  const HttpResult upgraded = perform(post(upgrading.url(), "payload"));
  ASSERT_TRUE(upgraded.response) << upgraded.error;
  EXPECT_EQ(upgraded.response->body, "got it");
  for (const std::string& url : {server->httpsURL("/leak"), detour.url()}) {
    EXPECT_EQ(perform(post(url, "payload")).error, "Redirect from https to " + open.url() + " refused");
  }
  EXPECT_EQ(open.connectionCount(), 0U);
}

}  // namespace
}  // namespace orvanta::platform
