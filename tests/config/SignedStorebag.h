#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "interface/Values.h"
#include "platform/codec/PropertyList.h"
#include "tests/support/TestPlatform.h"
#include "tools/storebag/SigningKey.h"
#include "tools/storebag/StorebagFile.h"

namespace orvanta::test {

using Bytes = std::vector<std::uint8_t>;
using KeyLayout = PublicKeyLayout;
using PlistForm = PropertyListForm;

inline void installKey(TestPlatform& device, const Bytes& der) {
  device.directory.write("share/publicKey.der", {reinterpret_cast<const char*>(der.data()), der.size()});
}
inline Bytes plistBytes(const Value& value, PlistForm form) {
  return writePropertyList(value, form).value();
}
// An outer document from decoded parts, which need not fit together.
inline std::string outerDocument(std::span<const std::uint8_t> signature, std::span<const std::uint8_t> bag,
                                 PlistForm form = PlistForm::xml) {
  const Dictionary parts{{"signature", platform::encodeBase64(signature)}, {"bag", platform::encodeBase64(bag)}};
  const Bytes bytes = plistBytes(parts, form);
  return {bytes.begin(), bytes.end()};
}

inline std::shared_ptr<const SigningKey> usualKey() {
  static const auto key = SigningKey::generate().value();  // once, since it takes long
  return key;
}

// A storebag server's side: a key pair and documents signed with it. Failures throw.
class StorebagSigner {
 public:
  explicit StorebagSigner(std::shared_ptr<const SigningKey> key = usualKey()) : _key(std::move(key)) {}

  Bytes publicKeyDer(KeyLayout layout) const { return _key->publicKeyDer(layout); }
  Bytes sign(std::span<const std::uint8_t> bag) const { return _key->sign(bag).value(); }
  // The whole document around a bag's bytes.
  std::string document(std::span<const std::uint8_t> bag, PlistForm form = PlistForm::xml) const {
    return outerDocument(sign(bag), bag, form);
  }
  std::string document(const Dictionary& bag) const { return document(plistBytes(bag, PlistForm::xml)); }

 private:
  const std::shared_ptr<const SigningKey> _key;
};

}  // namespace orvanta::test
