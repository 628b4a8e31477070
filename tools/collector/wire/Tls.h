#pragma once

#include <memory>
#include <string>
#include <utility>

#include "interface/Values.h"
#include "platform/core/UniqueFd.h"
#include "tools/collector/wire/Transport.h"

namespace orvanta::collector {

// A certificate and its private key, both PEM.
struct ServerIdentity {
  std::string certificatePem;
  std::string keyPem;
};

// A fault of the server's certificate, for tests of clients that must refuse it.
enum class CertificateFlaw { none, wrongHost, expired, selfSigned };

// The collector's own certificate authority: made on first start, kept in two files (ca.pem, and ca-key.pem with mode
// 0600), made anew when it is about to expire. Immutable.
class CertificateAuthority {
 public:
  // Replaces files that are missing, damaged or about to expire. A failure says which file cannot be written.
  static Result<CertificateAuthority> readOrMake(const std::string& directory);

  // For clients to trust.
  const std::string& certificateFile() const { return _certificateFile; }
  // A fresh certificate for localhost, 127.0.0.1 and ::1.
  Result<ServerIdentity> issueServerIdentity(CertificateFlaw flaw) const;

 private:
  CertificateAuthority(std::string certificateFile, ServerIdentity identity)
      : _certificateFile(std::move(certificateFile)), _identity(std::move(identity)) {}

  // Constant after construction.
  std::string _certificateFile;
  ServerIdentity _identity;
};

// The server side of TLS with one certificate. Immutable; the threads of a relay share it.
class TlsServer {
 public:
  static Result<std::shared_ptr<TlsServer>> make(const ServerIdentity& identity);
  virtual ~TlsServer() = default;
  // Returns at once; the stream shakes hands at its first read, so that the caller can interrupt it meanwhile. If the
  // peer breaks off, reads end at once.
  virtual std::unique_ptr<Transport> accept(platform::UniqueFd socket) = 0;
};

}  // namespace orvanta::collector
