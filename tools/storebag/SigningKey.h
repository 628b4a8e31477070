#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "interface/Values.h"

namespace orvanta {

// The DER layout of a public key file. Daemons read both.
enum class PublicKeyLayout { subjectPublicKeyInfo, pkcs1 };

// The RSA private key that storebags are signed with. Immutable; sign() may be called from several threads.
class SigningKey {
 public:
  static Result<std::shared_ptr<const SigningKey>> generate(unsigned bits = 2048);
  // A PEM file. The failure names the file.
  static Result<std::shared_ptr<const SigningKey>> read(const std::string& path);
  // Reads the file; if it does not exist, makes a key and writes it there (mode 0600).
  static Result<std::shared_ptr<const SigningKey>> readOrMake(const std::string& path);

  virtual ~SigningKey() = default;
  // A PEM file of mode 0600. The failure names the file.
  virtual Result<void> write(const std::string& path) const = 0;
  virtual std::vector<std::uint8_t> publicKeyDer(PublicKeyLayout layout) const = 0;
  // RSASSA-PKCS1-v1_5 over the SHA-1 of the bytes. Works even where the system's policy forbids SHA-1 signatures.
  virtual Result<std::vector<std::uint8_t>> sign(std::span<const std::uint8_t> bytes) const = 0;
};

}  // namespace orvanta
