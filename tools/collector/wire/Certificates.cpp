#include "tools/collector/wire/Tls.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <openssl/bio.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/rand.h>
#include <openssl/x509v3.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <memory>
#include <utility>

#include "platform/core/Text.h"
#include "platform/core/UniqueFd.h"
#include "platform/core/WholeFile.h"

namespace orvanta::collector {

namespace {

using KeyPointer = std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)>;
using CertificatePointer = std::unique_ptr<X509, decltype(&X509_free)>;
using BioPointer = std::unique_ptr<BIO, decltype(&BIO_free)>;

constexpr long kDay = 24L * 60 * 60;
constexpr long kAuthorityDays = 3650;
constexpr long kServerDays = 397;
constexpr long kRenewalDays = 30;
constexpr std::size_t kMaximumPemBytes = 1U << 20U;

Failure openSslFailure(std::string_view what) {
  const char* reason = ERR_reason_error_string(ERR_get_error());
  ERR_clear_error();
  return Failure{fmt::format("{}: {}", what, reason != nullptr ? reason : "unknown reason")};
}

bool addExtension(X509* certificate, X509* issuer, int kind, const char* value) {
  X509V3_CTX context;
  X509V3_set_ctx_nodb(&context);
  X509V3_set_ctx(&context, issuer, certificate, nullptr, nullptr, 0);
  const std::unique_ptr<X509_EXTENSION, decltype(&X509_EXTENSION_free)> extension(
      X509V3_EXT_conf_nid(nullptr, &context, kind, value), &X509_EXTENSION_free);
  return extension && X509_add_ext(certificate, extension.get(), -1) == 1;
}

// A certificate with name, serial number, validity and key, not yet signed; null on failure.
CertificatePointer newCertificate(EVP_PKEY* key, const char* commonName, long fromSeconds, long untilSeconds) {
  CertificatePointer certificate(X509_new(), &X509_free);
  std::array<unsigned char, 16> serial{};
  if (!certificate || RAND_bytes(serial.data(), serial.size()) != 1) return {nullptr, &X509_free};
  serial[0] &= 0x7FU;  // serial numbers are positive
  const std::unique_ptr<BIGNUM, decltype(&BN_free)> number(BN_bin2bn(serial.data(), serial.size(), nullptr), &BN_free);
  X509_NAME* name = X509_get_subject_name(certificate.get());
  const bool made =
      number && X509_set_version(certificate.get(), X509_VERSION_3) == 1 &&
      BN_to_ASN1_INTEGER(number.get(), X509_get_serialNumber(certificate.get())) != nullptr &&
      X509_gmtime_adj(X509_getm_notBefore(certificate.get()), fromSeconds) != nullptr &&
      X509_gmtime_adj(X509_getm_notAfter(certificate.get()), untilSeconds) != nullptr &&
      X509_NAME_add_entry_by_txt(name, "O", MBSTRING_ASC, reinterpret_cast<const unsigned char*>("orvanta-collector"),
                                 -1, -1, 0) == 1 &&
      X509_NAME_add_entry_by_txt(name, "CN", MBSTRING_ASC, reinterpret_cast<const unsigned char*>(commonName), -1, -1,
                                 0) == 1 &&
      X509_set_pubkey(certificate.get(), key) == 1;
  return made ? std::move(certificate) : CertificatePointer(nullptr, &X509_free);
}

std::string takeText(BIO* bio) {
  char* data = nullptr;
  const long size = BIO_get_mem_data(bio, &data);
  return size > 0 ? std::string(data, static_cast<std::size_t>(size)) : std::string();
}

ServerIdentity identityText(X509* certificate, EVP_PKEY* key) {
  const BioPointer certificateText(BIO_new(BIO_s_mem()), &BIO_free);
  const BioPointer keyText(BIO_new(BIO_s_mem()), &BIO_free);
  PEM_write_bio_X509(certificateText.get(), certificate);
  PEM_write_bio_PrivateKey(keyText.get(), key, nullptr, nullptr, 0, nullptr, nullptr);
  return {takeText(certificateText.get()), takeText(keyText.get())};
}

std::pair<CertificatePointer, KeyPointer> identityObjects(const ServerIdentity& identity) {
  const BioPointer certificateText(
      BIO_new_mem_buf(identity.certificatePem.data(), static_cast<int>(identity.certificatePem.size())), &BIO_free);
  const BioPointer keyText(BIO_new_mem_buf(identity.keyPem.data(), static_cast<int>(identity.keyPem.size())),
                           &BIO_free);
  CertificatePointer certificate(PEM_read_bio_X509(certificateText.get(), nullptr, nullptr, nullptr), &X509_free);
  KeyPointer key(PEM_read_bio_PrivateKey(keyText.get(), nullptr, nullptr, const_cast<char*>("")), &EVP_PKEY_free);
  ERR_clear_error();
  return {std::move(certificate), std::move(key)};
}

// Returns whether the pair belongs together and lasts long enough to be used once more.
bool usable(const ServerIdentity& identity) {
  const auto objects = identityObjects(identity);
  if (!objects.first || !objects.second) return false;
  if (X509_check_private_key(objects.first.get(), objects.second.get()) != 1) return ERR_clear_error(), false;
  int days = 0;
  int seconds = 0;
  return ASN1_TIME_diff(&days, &seconds, nullptr, X509_get0_notAfter(objects.first.get())) == 1 && days >= kRenewalDays;
}

Result<ServerIdentity> makeAuthority() {
  const KeyPointer key(EVP_EC_gen("P-256"), &EVP_PKEY_free);
  if (!key) return openSslFailure("cannot make the authority's key");
  const auto certificate = newCertificate(key.get(), "orvanta-collector authority", -kDay, kAuthorityDays * kDay);
  if (!certificate) return openSslFailure("cannot make the authority's certificate");
  X509_set_issuer_name(certificate.get(), X509_get_subject_name(certificate.get()));
  if (!addExtension(certificate.get(), certificate.get(), NID_basic_constraints, "critical,CA:TRUE,pathlen:0") ||
      !addExtension(certificate.get(), certificate.get(), NID_key_usage, "critical,keyCertSign,cRLSign") ||
      !addExtension(certificate.get(), certificate.get(), NID_subject_key_identifier, "hash") ||
      X509_sign(certificate.get(), key.get(), EVP_sha256()) == 0) {
    return openSslFailure("cannot make the authority's certificate");
  }
  return identityText(certificate.get(), key.get());
}

Result<void> writeText(const std::string& path, const std::string& text, mode_t mode) {
  const platform::UniqueFd file(::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, mode));
  if (!file || ::write(file.get(), text.data(), text.size()) != static_cast<ssize_t>(text.size())) {
    return Failure{fmt::format("cannot write {}: {}", path, platform::errnoText(errno))};
  }
  return {};
}

}  // namespace

Result<CertificateAuthority> CertificateAuthority::readOrMake(const std::string& directory) {
  const std::string certificateFile = directory + "/ca.pem";
  const std::string keyFile = directory + "/ca-key.pem";
  // A file that is missing or cannot be read counts as empty, and so the pair as unusable.
  const auto textOf = [](const std::string& path) {
    auto text = platform::readWholeFile(path, kMaximumPemBytes);
    return text ? std::move(*text) : std::string();
  };
  ServerIdentity kept{textOf(certificateFile), textOf(keyFile)};
  if (usable(kept)) return CertificateAuthority(certificateFile, std::move(kept));
  auto made = makeAuthority();
  if (!made) return Failure{made.error()};
  auto written = writeText(keyFile, made->keyPem, 0600);
  if (written) written = writeText(certificateFile, made->certificatePem, 0644);
  if (!written) return Failure{written.error()};
  return CertificateAuthority(certificateFile, std::move(made.value()));
}

Result<ServerIdentity> CertificateAuthority::issueServerIdentity(CertificateFlaw flaw) const {
  const auto authority = identityObjects(_identity);
  const KeyPointer key(EVP_EC_gen("P-256"), &EVP_PKEY_free);
  if (!key) return openSslFailure("cannot make the server's key");
  const bool expired = flaw == CertificateFlaw::expired;
  const auto certificate =
      newCertificate(key.get(), flaw == CertificateFlaw::wrongHost ? "elsewhere.invalid" : "localhost",
                     expired ? -2 * kDay : -kDay, expired ? -kDay : kServerDays * kDay);
  if (!certificate) return openSslFailure("cannot make the server's certificate");
  const bool selfSigned = flaw == CertificateFlaw::selfSigned;
  X509* issuer = selfSigned ? certificate.get() : authority.first.get();
  X509_set_issuer_name(certificate.get(), X509_get_subject_name(issuer));
  const char* names =
      flaw == CertificateFlaw::wrongHost ? "DNS:elsewhere.invalid" : "DNS:localhost,IP:127.0.0.1,IP:::1";
  if (!addExtension(certificate.get(), issuer, NID_basic_constraints, "critical,CA:FALSE") ||
      !addExtension(certificate.get(), issuer, NID_subject_alt_name, names) ||
      !addExtension(certificate.get(), issuer, NID_ext_key_usage, "serverAuth") ||
      X509_sign(certificate.get(), selfSigned ? key.get() : authority.second.get(), EVP_sha256()) == 0) {
    return openSslFailure("cannot make the server's certificate");
  }
  return identityText(certificate.get(), key.get());
}

}  // namespace orvanta::collector
