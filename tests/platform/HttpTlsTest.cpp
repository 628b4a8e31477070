#include <httplib.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/x509.h>
#include <openssl/x509v3.h>

#include <atomic>
#include <cstdio>
#include <stdexcept>
#include <thread>

#include "tests/platform/HttpFixture.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

using orvanta::test::TemporaryDirectory;

void require(bool ok, const char* what) {
  if (!ok) throw std::runtime_error(std::string("test certificates: ") + what);
}

void addExtension(X509* certificate, X509* issuer, int kind, const std::string& value) {
  X509V3_CTX context;
  X509V3_set_ctx(&context, issuer, certificate, nullptr, nullptr, 0);
  X509_EXTENSION* extension = X509V3_EXT_conf_nid(nullptr, &context, kind, value.c_str());
  require(extension != nullptr && X509_add_ext(certificate, extension, -1) == 1, value.c_str());
  X509_EXTENSION_free(extension);
}

struct Description {
  std::string commonName;
  std::string names;  // empty: an authority
  long serial = 0;
  long validFrom = 0;
  long validTo = 0;
};

// Null issuer: signed by itself.
X509* makeCertificate(EVP_PKEY* key, const Description& description, X509* issuer, EVP_PKEY* issuerKey) {
  X509* certificate = X509_new();
  X509_set_version(certificate, 2);
  ASN1_INTEGER_set(X509_get_serialNumber(certificate), description.serial);
  X509_gmtime_adj(X509_getm_notBefore(certificate), description.validFrom);
  X509_gmtime_adj(X509_getm_notAfter(certificate), description.validTo);
  X509_set_pubkey(certificate, key);
  X509_NAME* name = X509_get_subject_name(certificate);
  X509_NAME_add_entry_by_txt(name, "CN", MBSTRING_ASC,
                             reinterpret_cast<const unsigned char*>(description.commonName.c_str()), -1, -1, 0);
  X509* const signer = issuer != nullptr ? issuer : certificate;
  X509_set_issuer_name(certificate, X509_get_subject_name(signer));
  if (description.names.empty()) {
    addExtension(certificate, signer, NID_basic_constraints, "critical,CA:TRUE");
    addExtension(certificate, signer, NID_key_usage, "critical,keyCertSign");
  } else {
    addExtension(certificate, signer, NID_subject_alt_name, description.names);
  }
  require(X509_sign(certificate, issuerKey != nullptr ? issuerKey : key, EVP_sha256()) > 0, "signing");
  return certificate;
}

struct Material {
  Material(const Description& description, const Material* issuer)
      : key(EVP_EC_gen("P-256")),
        certificate(makeCertificate(key, description, issuer != nullptr ? issuer->certificate : nullptr,
                                    issuer != nullptr ? issuer->key : nullptr)) {}
  ~Material() {
    X509_free(certificate);
    EVP_PKEY_free(key);
  }
  Material(const Material&) = delete;
  Material& operator=(const Material&) = delete;

  EVP_PKEY* const key;
  X509* const certificate;
};

// A certificate and its key, as PEM files for a TLS server.
struct TestIdentity {
  std::string certificateFile;
  std::string keyFile;
};

// A certificate authority that exists for one test and issues what a test needs, good and bad, as files in `directory`.
class TestAuthority {
 public:
  explicit TestAuthority(std::string directory)
      : _directory(std::move(directory)), _file(write(_own).certificateFile) {}

  // The authority's own certificate, for clients that shall trust it.
  const std::string& file() const { return _file; }

  // `names`: subject alternative names in OpenSSL's notation; the validity is in seconds from now.
  TestIdentity issue(const std::string& names = "DNS:localhost,IP:127.0.0.1", long validFrom = -3600,
                     long validTo = 3600) {
    return write(Material({"test server", names, ++_serial, validFrom, validTo}, &_own));
  }
  TestIdentity selfSigned(const std::string& names) {
    return write(Material({"test server", names, ++_serial, -3600, 3600}, nullptr));
  }

 private:
  TestIdentity write(const Material& material) const {
    const std::string base = _directory + "/certificate" + std::to_string(_serial);
    TestIdentity identity{base + ".pem", base + ".key"};
    std::FILE* file = std::fopen(identity.certificateFile.c_str(), "w");
    require(file != nullptr && PEM_write_X509(file, material.certificate) == 1, "writing a certificate");
    std::fclose(file);
    file = std::fopen(identity.keyFile.c_str(), "w");
    require(file != nullptr && PEM_write_PrivateKey(file, material.key, nullptr, nullptr, 0, nullptr, nullptr) == 1,
            "writing a key");
    std::fclose(file);
    return identity;
  }

  const std::string _directory;
  long _serial = 1;
  const Material _own{{"Test Authority", {}, 1, -7200, 7200}, nullptr};
  const std::string _file;
};

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
