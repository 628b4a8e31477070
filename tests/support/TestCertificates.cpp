#include "tests/support/TestCertificates.h"

#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/x509.h>
#include <openssl/x509v3.h>

#include <cstdio>
#include <stdexcept>

namespace orvanta::test {

namespace {

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

}  // namespace

struct TestAuthority::Material {
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

TestAuthority::TestAuthority(std::string directory) : _directory(std::move(directory)) {
  _own = std::make_unique<Material>(Description{"Test Authority", {}, _serial++, -7200, 7200}, nullptr);
  _file = write(*_own).certificateFile;
}

TestAuthority::~TestAuthority() = default;

TestIdentity TestAuthority::issue(const std::string& names, long validFrom, long validTo) {
  return write(Material({"test server", names, _serial++, validFrom, validTo}, _own.get()));
}

TestIdentity TestAuthority::selfSigned(const std::string& names) {
  return write(Material({"test server", names, _serial++, -3600, 3600}, nullptr));
}

TestIdentity TestAuthority::write(const Material& material) {
  const std::string base = _directory + "/certificate" + std::to_string(_serial);
  const TestIdentity identity{base + ".pem", base + ".key"};
  std::FILE* file = std::fopen(identity.certificateFile.c_str(), "w");
  require(file != nullptr && PEM_write_X509(file, material.certificate) == 1, "writing a certificate");
  std::fclose(file);
  file = std::fopen(identity.keyFile.c_str(), "w");
  require(file != nullptr && PEM_write_PrivateKey(file, material.key, nullptr, nullptr, 0, nullptr, nullptr) == 1,
          "writing a key");
  std::fclose(file);
  return identity;
}

}  // namespace orvanta::test
