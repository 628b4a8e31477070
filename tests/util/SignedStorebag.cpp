#include "tests/util/SignedStorebag.h"

#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

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

template <class Encode>
Bytes encoded(Encode encode) {
  unsigned char* der = nullptr;
  const int length = encode(&der);
  const std::unique_ptr<unsigned char, void (*)(unsigned char*)> owner(der, [](unsigned char* p) { OPENSSL_free(p); });
  if (length <= 0) throw std::runtime_error("the key cannot be encoded");
  return {der, der + length};
}

}  // namespace

StorebagSigner::StorebagSigner(const std::string& keyName) {
  static std::map<std::string, std::unique_ptr<EVP_PKEY, void (*)(EVP_PKEY*)>> keys;
  auto found = keys.find(keyName);
  if (found == keys.end()) {
    EVP_PKEY* made = must(EVP_RSA_gen(2048), "no key");
    found = keys.emplace(keyName, std::unique_ptr<EVP_PKEY, void (*)(EVP_PKEY*)>(made, EVP_PKEY_free)).first;
  }
  _key = found->second.get();
}

Bytes StorebagSigner::publicKeyDer(KeyLayout layout) const {
  auto* key = static_cast<EVP_PKEY*>(_key);
  if (layout == KeyLayout::subjectPublicKeyInfo)
    return encoded([&](unsigned char** der) { return i2d_PUBKEY(key, der); });
  return encoded([&](unsigned char** der) { return i2d_PublicKey(key, der); });
}

Bytes StorebagSigner::sign(std::span<const std::uint8_t> bag, SigningDigest digest) const {
  const std::unique_ptr<EVP_MD_CTX, void (*)(EVP_MD_CTX*)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  const EVP_MD* algorithm = digest == SigningDigest::sha1 ? EVP_sha1() : EVP_sha256();
  Bytes signature(512);
  std::size_t length = signature.size();
  must(EVP_DigestSignInit(context.get(), nullptr, algorithm, nullptr, static_cast<EVP_PKEY*>(_key)) == 1, "init");
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
