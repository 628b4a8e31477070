#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>

namespace orvanta::platform {

// Digests over OpenSSL, whose algorithm objects are fetched once per process. Thread-safe.
std::array<std::uint8_t, 20> sha1(std::span<const std::uint8_t> bytes);
std::array<std::uint8_t, 32> sha256(std::span<const std::uint8_t> bytes);

// An RSA public key for PKCS#1 v1.5 signatures over SHA-1. Immutable; verify() may be called from several threads.
class RsaPublicKey {
 public:
  // DER, either SubjectPublicKeyInfo or PKCS#1 RSAPublicKey. Null when it is neither, or not an RSA key.
  static std::unique_ptr<RsaPublicKey> fromDer(std::span<const std::uint8_t> der);
  virtual ~RsaPublicKey() = default;
  // `digest` is the SHA-1 of what was signed. Works even where the system's policy forbids SHA-1 signatures.
  virtual bool verifySha1(std::span<const std::uint8_t> digest, std::span<const std::uint8_t> signature) const = 0;
};

// A random UUID (version 4): its 16 bytes, and the canonical text in upper case.
std::array<std::uint8_t, 16> randomUuid();
std::string uuidText(const std::array<std::uint8_t, 16>& uuid);

}  // namespace orvanta::platform
