#include "platform/host/Digest.h"

#include <gtest/gtest.h>
#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <algorithm>
#include <vector>

#include "platform/core/Text.h"
#include "tests/support/Bytes.h"
#include "tests/support/Threads.h"

namespace orvanta::platform {
namespace {

using orvanta::test::bytesOf;
using orvanta::test::fromHex;
using Bytes = std::vector<std::uint8_t>;

Bytes joined(std::initializer_list<Bytes> parts) {
  Bytes all;
  for (const Bytes& part : parts) all.insert(all.end(), part.begin(), part.end());
  return all;
}

TEST(Digest, KnownAnswers) {
  const auto text = bytesOf("abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq");
  EXPECT_EQ(hexText(sha1(text)), "84983e441c3bd26ebaae4aa1f95129e5e54670f1");
  EXPECT_EQ(hexText(sha256(text)), "248d6a61d20638b8e5c026930c3e6039a33ce45964ff2167f6ecedd419db06c1");
}

TEST(Digest, ThreadsDoNotDisturbEachOther) {
  orvanta::test::inThreads(4, [expected = sha256(bytesOf("x"))](int) {
    for (int n = 0; n < 500; ++n) EXPECT_EQ(sha256(bytesOf("x")), expected);
  });
}

template <class Encoder>
Bytes encoded(const EVP_PKEY* key, Encoder encode) {
  unsigned char* der = nullptr;
  const int length = encode(key, &der);
  Bytes bytes(der, der + length);
  OPENSSL_free(der);
  return bytes;
}

// An RSA key pair that signs any block, malformed ones too.
class KeyPair {
 public:
  KeyPair() : _key(EVP_RSA_gen(1024)) {}
  ~KeyPair() { EVP_PKEY_free(_key); }
  KeyPair(const KeyPair&) = delete;
  KeyPair& operator=(const KeyPair&) = delete;

  Bytes subjectPublicKeyInfo() const { return encoded(_key, i2d_PUBKEY); }
  Bytes pkcs1() const { return encoded(_key, i2d_PublicKey); }
  std::size_t size() const { return static_cast<std::size_t>(EVP_PKEY_get_size(_key)); }

  // The private operation on a whole block of the key's size.
  Bytes signBlock(const Bytes& block) const {
    EVP_PKEY_CTX* context = EVP_PKEY_CTX_new(_key, nullptr);
    Bytes signature(size());
    std::size_t length = signature.size();
    EXPECT_EQ(block.size(), size());
    EXPECT_EQ(EVP_PKEY_sign_init(context), 1);
    EXPECT_EQ(EVP_PKEY_CTX_set_rsa_padding(context, RSA_NO_PADDING), 1);
    EXPECT_EQ(EVP_PKEY_sign(context, signature.data(), &length, block.data(), block.size()), 1);
    EVP_PKEY_CTX_free(context);
    return signature;
  }

 private:
  EVP_PKEY* _key;
};

const Bytes kDigestInfo = fromHex("3021300906052b0e03021a05000414");

// That right ones are accepted, with keys of either form, the storebags' tests show.
class RsaTest : public testing::Test {
 protected:
  static const KeyPair& pair() {
    static const KeyPair* const pair = new KeyPair();
    return *pair;
  }
  // 00 TYPE FF... 00 TAIL, filled up to the key's size.
  static Bytes block(const Bytes& tail, std::uint8_t type = 1) {
    Bytes all{0, type};
    all.resize(pair().size() - tail.size() - 1, 0xff);
    return joined({all, Bytes{0}, tail});
  }
  static Bytes keyWithExponentOne() {
    Bytes der = pair().pkcs1();  // 30 81 LENGTH ... and at the end INTEGER 65537: 02 03 01 00 01
    der.erase(der.end() - 5, der.end());
    der.insert(der.end(), {0x02, 0x01, 0x01});
    der[2] = static_cast<std::uint8_t>(der[2] - 2);
    return der;
  }
  static Bytes digestBytes() {
    const auto digest = sha1(bytesOf("signed text"));
    return {digest.begin(), digest.end()};
  }
  const std::unique_ptr<RsaPublicKey> _key = RsaPublicKey::fromDer(pair().subjectPublicKeyInfo());
};

TEST_F(RsaTest, RefusesForgedPaddingAndForeignDigests) {
  const Bytes digest = digestBytes();
  const Bytes good = joined({kDigestInfo, digest});
  const std::size_t size = pair().size();
  Bytes changedDigest = digest;
  changedDigest[7] ^= 1U;
  Bytes zeroPadding(size, 0);
  zeroPadding[1] = 1;
  std::copy(good.begin(), good.end(), zeroPadding.end() - static_cast<std::ptrdiff_t>(good.size()));
  // A verifier that stops reading behind the digest accepts this: few padding bytes, the digest, then free space.
  Bytes garbageBehind = joined({fromHex("0001ffffffffffffffff00"), good});
  garbageBehind.resize(size, 0x5a);
  const struct {
    const char* what;
    Bytes block;
  } rows[] = {
      {"garbage behind the digest", garbageBehind},
      {"seven bytes of padding", joined({fromHex("0001ffffffffffffff00"), Bytes(size - 10 - good.size(), 0), good})},
      {"padding of zeros", zeroPadding},
      {"block type 2", block(good, 2)},
      {"no NULL parameter", block(joined({fromHex("301f300706052b0e03021a0414"), digest}))},
      {"SHA-256's identifier", block(joined({fromHex("302130 0d06 09 608648016503040201 0500 0414"), digest}))},
      {"the bare digest", block(digest)},
      {"another digest", block(joined({kDigestInfo, changedDigest}))},
  };
  for (const auto& row : rows) EXPECT_FALSE(_key->verifySha1(digest, pair().signBlock(row.block))) << row.what;
}

TEST_F(RsaTest, RefusesSignaturesThatAreNone) {
  const Bytes digest = digestBytes();
  const Bytes signature = pair().signBlock(block(joined({kDigestInfo, digest})));
  Bytes flipped = signature;
  flipped.back() ^= 1U;
  const Bytes shorter(signature.begin(), signature.end() - 1);
  const Bytes extended = joined({Bytes{0}, signature});
  for (const Bytes& bad : {Bytes{}, flipped, shorter, extended, Bytes(pair().size(), 0xff), Bytes(5000, 1)}) {
    EXPECT_FALSE(_key->verifySha1(digest, bad)) << bad.size();
  }
  EXPECT_FALSE(_key->verifySha1({}, signature));
  EXPECT_FALSE(_key->verifySha1(sha256(bytesOf("signed text")), signature));
  EXPECT_FALSE(RsaPublicKey::fromDer(KeyPair().pkcs1())->verifySha1(digest, signature)) << "another key";
}

// A signature number below 256^(size-1) may be written with fewer bytes by a sloppy signer; only the full length
// counts.
TEST_F(RsaTest, RefusesASignatureWithoutItsLeadingZero) {
  for (int i = 0; i < 20000; ++i) {
    const auto digest = sha1(bytesOf(std::to_string(i)));
    const Bytes signature = pair().signBlock(block(joined({kDigestInfo, Bytes(digest.begin(), digest.end())})));
    if (signature[0] != 0) continue;
    EXPECT_TRUE(_key->verifySha1(digest, signature));
    EXPECT_FALSE(_key->verifySha1(digest, Bytes(signature.begin() + 1, signature.end())));
    return;
  }
  FAIL() << "no signature began with a zero";
}

TEST_F(RsaTest, RefusesWhatIsNoUsableKey) {
  const Bytes good = pair().subjectPublicKeyInfo();
  EVP_PKEY* elliptic = EVP_EC_gen("P-256");
  const Bytes ellipticDer = encoded(elliptic, i2d_PUBKEY);
  EVP_PKEY_free(elliptic);
  const struct {
    const char* what;
    Bytes der;
  } rows[] = {
      {"nothing", {}},
      {"cut off", Bytes(good.begin(), good.end() - 1)},
      {"bytes behind it", joined({good, Bytes{0}})},
      {"an elliptic-curve key", ellipticDer},
      {"an exponent that lets anyone sign", keyWithExponentOne()},
  };
  for (const auto& row : rows) EXPECT_EQ(RsaPublicKey::fromDer(row.der), nullptr) << row.what;
}

}  // namespace
}  // namespace orvanta::platform
