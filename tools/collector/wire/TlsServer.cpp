#include "tools/collector/wire/Tls.h"

#include <openssl/bio.h>
#include <openssl/err.h>
#include <openssl/pem.h>
#include <openssl/ssl.h>

#include <algorithm>
#include <climits>
#include <utility>

namespace orvanta::collector {

namespace {

using ContextPointer = std::unique_ptr<SSL_CTX, decltype(&SSL_CTX_free)>;
using StreamPointer = std::unique_ptr<SSL, decltype(&SSL_free)>;

// Shakes hands at the first read, so that a peer that never does holds up its own thread only.
class TlsTransport final : public Transport {
 public:
  TlsTransport(platform::UniqueFd socket, SSL_CTX* context)
      : Transport(std::move(socket)), _stream(SSL_new(context), &SSL_free) {
    if (_stream) SSL_set_fd(_stream.get(), descriptor());
    if (_stream) SSL_set_accept_state(_stream.get());
  }

  std::size_t read(char* buffer, std::size_t size) override {
    if (!_stream || _failed) return 0;
    std::size_t count = 0;
    if (SSL_read_ex(_stream.get(), buffer, size, &count) == 1) return count;
    return fail(), 0;
  }
  bool write(std::string_view bytes) override {
    if (bytes.empty()) return true;
    std::size_t count = 0;
    if (!_stream || _failed) return false;
    if (SSL_write_ex(_stream.get(), bytes.data(), bytes.size(), &count) == 1) return true;
    return fail(), false;
  }
  void finish() override {
    if (_stream && !_failed) SSL_shutdown(_stream.get());
    ERR_clear_error();
  }

 private:
  // After a failure OpenSSL must not be asked again, not even to say goodbye.
  void fail() {
    _failed = true;
    ERR_clear_error();
  }

  const StreamPointer _stream;
  bool _failed = false;
};

class OpenSslServer final : public TlsServer {
 public:
  explicit OpenSslServer(ContextPointer context) : _context(std::move(context)) {}
  std::unique_ptr<Transport> accept(platform::UniqueFd socket) override {
    return std::make_unique<TlsTransport>(std::move(socket), _context.get());
  }

 private:
  const ContextPointer _context;
};

}  // namespace

Result<std::shared_ptr<TlsServer>> TlsServer::make(const ServerIdentity& identity) {
  ContextPointer context(SSL_CTX_new(TLS_server_method()), &SSL_CTX_free);
  const std::unique_ptr<BIO, decltype(&BIO_free)> certificateText(
      BIO_new_mem_buf(identity.certificatePem.data(), static_cast<int>(identity.certificatePem.size())), &BIO_free);
  const std::unique_ptr<BIO, decltype(&BIO_free)> keyText(
      BIO_new_mem_buf(identity.keyPem.data(), static_cast<int>(identity.keyPem.size())), &BIO_free);
  if (!context || !certificateText || !keyText) return Failure{"cannot start TLS"};
  const std::unique_ptr<X509, decltype(&X509_free)> certificate(
      PEM_read_bio_X509(certificateText.get(), nullptr, nullptr, nullptr), &X509_free);
  const std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> key(
      PEM_read_bio_PrivateKey(keyText.get(), nullptr, nullptr, nullptr), &EVP_PKEY_free);
  if (!certificate || !key || SSL_CTX_use_certificate(context.get(), certificate.get()) != 1 ||
      SSL_CTX_use_PrivateKey(context.get(), key.get()) != 1) {
    ERR_clear_error();
    return Failure{"the server certificate cannot be used"};
  }
  SSL_CTX_set_min_proto_version(context.get(), TLS1_2_VERSION);
  SSL_CTX_set_mode(context.get(), SSL_MODE_AUTO_RETRY);
  return std::shared_ptr<TlsServer>(std::make_shared<OpenSslServer>(std::move(context)));
}

}  // namespace orvanta::collector
