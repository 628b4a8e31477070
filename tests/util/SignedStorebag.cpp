#include "tests/util/SignedStorebag.h"

#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <algorithm>
#include <map>
#include <memory>
#include <stdexcept>

#include "platform/PropertyList.h"

namespace orvanta::test {

namespace {

template <class T>
T must(T result, const char* what) {
  if (!result) throw std::runtime_error(what);
  return result;
}

}  // namespace

StorebagSigner::StorebagSigner(const std::string& keyName) {
  static std::map<std::string, std::shared_ptr<EVP_PKEY>> keys;
  auto& key = keys[keyName];
  if (!key) key.reset(must(EVP_RSA_gen(2048), "no key"), EVP_PKEY_free);
  _key = key.get();
}

Bytes StorebagSigner::publicKeyDer(KeyLayout layout) const {
  auto* key = static_cast<EVP_PKEY*>(_key);
  const auto encode = layout == KeyLayout::pkcs1 ? i2d_PublicKey : i2d_PUBKEY;
  Bytes der(static_cast<std::size_t>(must(std::max(encode(key, nullptr), 0), "the key cannot be encoded")));
  unsigned char* to = der.data();
  encode(key, &to);
  return der;
}

Bytes StorebagSigner::sign(std::span<const std::uint8_t> bag) const {
  const std::unique_ptr<EVP_MD_CTX, void (*)(EVP_MD_CTX*)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  Bytes signature(512);
  std::size_t length = signature.size();
  must(EVP_DigestSignInit(context.get(), nullptr, EVP_sha1(), nullptr, static_cast<EVP_PKEY*>(_key)) == 1, "init");
  must(EVP_DigestSign(context.get(), signature.data(), &length, bag.data(), bag.size()) == 1, "sign");
  signature.resize(length);
  return signature;
}

std::string StorebagSigner::document(std::span<const std::uint8_t> bag, PlistForm form) const {
  return outerDocument(sign(bag), bag, form);
}

std::string StorebagSigner::document(const platform::Dictionary& bag, PlistForm form) const {
  return document(plistBytes(bag, form), form);
}

void installKey(TestPlatform& device, const Bytes& der) {
  device.directory.write("share/publicKey.der", {reinterpret_cast<const char*>(der.data()), der.size()});
}

Bytes plistBytes(const platform::Value& value, PlistForm form) {
  if (form == PlistForm::binary) return platform::writeBinaryPropertyList(value).value();
  const std::string text = platform::writeXmlPropertyList(value).value();
  return {text.begin(), text.end()};
}

std::string outerDocument(std::span<const std::uint8_t> signature, std::span<const std::uint8_t> bag, PlistForm form) {
  const Bytes bytes = plistBytes(
      platform::Dictionary{{"signature", platform::encodeBase64(signature)}, {"bag", platform::encodeBase64(bag)}},
      form);
  return {bytes.begin(), bytes.end()};
}

}  // namespace orvanta::test
