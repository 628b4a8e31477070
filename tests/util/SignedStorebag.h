#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "platform/Value.h"
#include "tests/support/TestPlatform.h"

namespace orvanta::test {

using Bytes = std::vector<std::uint8_t>;

enum class PlistForm { xml, binary };
enum class KeyLayout { subjectPublicKeyInfo, pkcs1 };

// A storebag server's side: a key pair, made once per name and process, and documents signed with it. Failures throw.
class StorebagSigner {
 public:
  explicit StorebagSigner(const std::string& keyName = "server");

  Bytes publicKeyDer(KeyLayout layout) const;
  Bytes sign(std::span<const std::uint8_t> bag) const;
  // The whole document around a bag's bytes.
  std::string document(std::span<const std::uint8_t> bag, PlistForm form = PlistForm::xml) const;
  std::string document(const platform::Dictionary& bag, PlistForm form = PlistForm::xml) const;

 private:
  void* _key;  // an EVP_PKEY that lives as long as the process
};

void installKey(TestPlatform& device, const Bytes& der);
Bytes plistBytes(const platform::Value& value, PlistForm form);
// An outer document from decoded parts, which need not fit together.
std::string outerDocument(std::span<const std::uint8_t> signature, std::span<const std::uint8_t> bag,
                          PlistForm form = PlistForm::xml);

}  // namespace orvanta::test
