#pragma once

#include <string>

#include "interface/Values.h"

namespace orvanta::collector {

// A certificate and its private key, both PEM.
struct ServerIdentity {
  std::string certificatePem;
  std::string keyPem;
};

// What is wrong with the server's certificate, for tests of those who have to notice.
enum class CertificateFlaw { none, wrongHost, expired, selfSigned };

// The collector's own certificate authority: made on first start, kept in two files (ca.pem, ca-key.pem, the latter for
// its owner's eyes only), made anew when it is about to expire.
class CertificateAuthority {
 public:
  static Result<CertificateAuthority> readOrMake(const std::string& directory);

  // What clients have to trust.
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

}  // namespace orvanta::collector
