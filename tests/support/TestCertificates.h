#pragma once

#include <memory>
#include <string>

namespace orvanta::test {

// A certificate and its key, as PEM files for a TLS server.
struct TestIdentity {
  std::string certificateFile;
  std::string keyFile;
};

// A certificate authority that exists for one test and issues what a test needs, good and bad.
class TestAuthority {
 public:
  // Writes its files into `directory`.
  explicit TestAuthority(std::string directory);
  ~TestAuthority();
  TestAuthority(const TestAuthority&) = delete;
  TestAuthority& operator=(const TestAuthority&) = delete;

  // The authority's own certificate, for clients that shall trust it.
  const std::string& file() const { return _file; }

  // `names`: subject alternative names in OpenSSL's notation; the validity is in seconds from now.
  TestIdentity issue(const std::string& names = "DNS:localhost,IP:127.0.0.1", long validFrom = -3600,
                     long validTo = 3600);
  TestIdentity selfSigned(const std::string& names = "DNS:localhost,IP:127.0.0.1");

 private:
  struct Material;
  TestIdentity write(const Material& material);

  const std::string _directory;
  std::string _file;
  std::unique_ptr<Material> _own;
  long _serial = 1;
};

}  // namespace orvanta::test
