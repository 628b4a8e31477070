#include "tools/storebag/SigningKey.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <openssl/bio.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <utility>

#include "platform/core/Text.h"
#include "platform/core/WholeFile.h"
#include "platform/host/Digest.h"

namespace orvanta {

namespace {

constexpr std::size_t kMaximumPemBytes = 1U << 20U;

using KeyPointer = std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)>;
using ContextPointer = std::unique_ptr<EVP_PKEY_CTX, decltype(&EVP_PKEY_CTX_free)>;
using BioPointer = std::unique_ptr<BIO, decltype(&BIO_free)>;
using FilePointer = std::unique_ptr<std::FILE, decltype(&std::fclose)>;

// The DER of DigestInfo for SHA-1, which precedes the 20 digest bytes in the signed block.
constexpr std::array<std::uint8_t, 15> kSha1DigestInfo{0x30, 0x21, 0x30, 0x09, 0x06, 0x05, 0x2b, 0x0e,
                                                       0x03, 0x02, 0x1a, 0x05, 0x00, 0x04, 0x14};

std::string lastOpenSslError() {
  const char* reason = ERR_reason_error_string(ERR_get_error());
  ERR_clear_error();
  return reason != nullptr ? reason : "unknown reason";
}

class OpenSslSigningKey final : public SigningKey {
 public:
  explicit OpenSslSigningKey(KeyPointer key) : _key(std::move(key)) {}

  Result<void> write(const std::string& path) const override {
    const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    const FilePointer file(fd < 0 ? nullptr : ::fdopen(fd, "w"), &std::fclose);
    if (!file) return Failure{fmt::format("cannot write {}: {}", path, platform::errnoText(errno))};
    if (PEM_write_PrivateKey(file.get(), _key.get(), nullptr, nullptr, 0, nullptr, nullptr) != 1 ||
        std::fflush(file.get()) != 0) {
      return Failure{fmt::format("cannot write {}: {}", path, lastOpenSslError())};
    }
    return {};
  }

  std::vector<std::uint8_t> publicKeyDer(PublicKeyLayout layout) const override {
    unsigned char* der = nullptr;
    const int size = layout == PublicKeyLayout::pkcs1 ? i2d_PublicKey(_key.get(), &der) : i2d_PUBKEY(_key.get(), &der);
    std::vector<std::uint8_t> bytes;
    if (size > 0) bytes.assign(der, der + size);
    OPENSSL_free(der);
    return bytes;
  }

  Result<std::vector<std::uint8_t>> sign(std::span<const std::uint8_t> bytes) const override {
    const auto digest = platform::sha1(bytes);
    std::array<std::uint8_t, kSha1DigestInfo.size() + digest.size()> block{};
    std::copy(kSha1DigestInfo.begin(), kSha1DigestInfo.end(), block.begin());
    std::copy(digest.begin(), digest.end(), block.begin() + kSha1DigestInfo.size());
    // Without a digest set the block is padded and signed as it is, which no digest policy forbids.
    const ContextPointer context(EVP_PKEY_CTX_new(_key.get(), nullptr), &EVP_PKEY_CTX_free);
    std::size_t size = 0;
    if (!context || EVP_PKEY_sign_init(context.get()) != 1 ||
        EVP_PKEY_CTX_set_rsa_padding(context.get(), RSA_PKCS1_PADDING) != 1 ||
        EVP_PKEY_sign(context.get(), nullptr, &size, block.data(), block.size()) != 1) {
      return Failure{"cannot sign: " + lastOpenSslError()};
    }
    std::vector<std::uint8_t> signature(size);
    if (EVP_PKEY_sign(context.get(), signature.data(), &size, block.data(), block.size()) != 1) {
      return Failure{"cannot sign: " + lastOpenSslError()};
    }
    signature.resize(size);
    return signature;
  }

 private:
  const KeyPointer _key;
};

}  // namespace

Result<std::shared_ptr<const SigningKey>> SigningKey::generate(unsigned bits) {
  KeyPointer key(EVP_RSA_gen(bits), &EVP_PKEY_free);
  if (!key) return Failure{"cannot make an RSA key: " + lastOpenSslError()};
  return std::shared_ptr<const SigningKey>(std::make_shared<OpenSslSigningKey>(std::move(key)));
}

Result<std::shared_ptr<const SigningKey>> SigningKey::read(const std::string& path) {
  const auto pem = platform::readWholeFile(path, kMaximumPemBytes);
  if (!pem) return Failure{pem.error()};
  const BioPointer source(BIO_new_mem_buf(pem->data(), static_cast<int>(pem->size())), &BIO_free);
  // The empty pass phrase keeps OpenSSL from asking for one on the terminal.
  KeyPointer key(PEM_read_bio_PrivateKey(source.get(), nullptr, nullptr, const_cast<char*>("")), &EVP_PKEY_free);
  if (!key) return Failure{fmt::format("{} holds no private key in PEM form: {}", path, lastOpenSslError())};
  if (EVP_PKEY_get_base_id(key.get()) != EVP_PKEY_RSA) return Failure{path + " is not an RSA key"};
  return std::shared_ptr<const SigningKey>(std::make_shared<OpenSslSigningKey>(std::move(key)));
}

Result<std::shared_ptr<const SigningKey>> SigningKey::readOrMake(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) == 0 || errno != ENOENT) return read(path);
  auto made = generate();
  if (!made) return made;
  if (const auto written = made.value()->write(path); !written) return Failure{written.error()};
  return made;
}

}  // namespace orvanta
