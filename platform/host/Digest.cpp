#include "platform/host/Digest.h"

#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>
#include <uuid/uuid.h>

#include <algorithm>
#include <cstdlib>

#include "platform/core/Log.h"

namespace orvanta::platform {

namespace {

struct EvpDeleter {
  void operator()(EVP_MD_CTX* context) const { EVP_MD_CTX_free(context); }
  void operator()(EVP_PKEY_CTX* context) const { EVP_PKEY_CTX_free(context); }
  void operator()(EVP_PKEY* key) const { EVP_PKEY_free(key); }
};
using DigestContext = std::unique_ptr<EVP_MD_CTX, EvpDeleter>;
using KeyContext = std::unique_ptr<EVP_PKEY_CTX, EvpDeleter>;
using Key = std::unique_ptr<EVP_PKEY, EvpDeleter>;

// A process whose digests do not work can neither verify its configuration nor hash what must not go out in clear.
[[noreturn]] void digestsUnavailable(const char* name) {
  PLATFORM_LOG(error, "Digest: OpenSSL gives no {}", name);
  std::abort();
}

// One context per thread and algorithm: making one costs more than hashing a short text. The algorithm is never freed,
// so that threads which end late can still use it.
template <std::size_t Size>
std::array<std::uint8_t, Size> digest(const EVP_MD* algorithm, const char* name, DigestContext& context,
                                      std::span<const std::uint8_t> bytes) {
  std::array<std::uint8_t, Size> result{};
  unsigned length = 0;
  if (!context) context.reset(EVP_MD_CTX_new());
  if (algorithm == nullptr || !context || EVP_DigestInit_ex2(context.get(), algorithm, nullptr) != 1 ||
      EVP_DigestUpdate(context.get(), bytes.data(), bytes.size()) != 1 ||
      EVP_DigestFinal_ex(context.get(), result.data(), &length) != 1 || length != Size) {
    digestsUnavailable(name);
  }
  return result;
}

// Takes what an attempt that may fail leaves in the thread's error queue out again: the next user of OpenSSL on this
// thread would take it for its own.
class ErrorQueueMark {
 public:
  ErrorQueueMark() { ERR_set_mark(); }
  ~ErrorQueueMark() { ERR_pop_to_mark(); }
  ErrorQueueMark(const ErrorQueueMark&) = delete;
  ErrorQueueMark& operator=(const ErrorQueueMark&) = delete;
};

// DigestInfo of SHA-1 up to the digest itself: SEQUENCE { SEQUENCE { OID 1.3.14.3.2.26, NULL }, OCTET STRING of 20 }.
constexpr std::array<std::uint8_t, 15> kSha1DigestInfo{0x30, 0x21, 0x30, 0x09, 0x06, 0x05, 0x2b, 0x0e,
                                                       0x03, 0x02, 0x1a, 0x05, 0x00, 0x04, 0x14};
constexpr std::size_t kSha1Size = 20;

class OpenSslRsaPublicKey final : public RsaPublicKey {
 public:
  explicit OpenSslRsaPublicKey(Key key) : _key(std::move(key)) {}

  // The padded block is given to OpenSSL whole, as raw bytes without a digest's name: a policy that forbids SHA-1 in
  // signatures looks at the name. OpenSSL takes off the padding, strictly, and what is left must be these 35 bytes.
  bool verifySha1(std::span<const std::uint8_t> digest, std::span<const std::uint8_t> signature) const override {
    // Without the check of its length a signature could also be given without its leading zeros.
    if (digest.size() != kSha1Size || signature.size() != static_cast<std::size_t>(EVP_PKEY_get_size(_key.get()))) {
      return false;
    }
    const ErrorQueueMark mark;
    std::array<std::uint8_t, kSha1DigestInfo.size() + kSha1Size> block{};
    std::copy(digest.begin(), digest.end(), std::copy(kSha1DigestInfo.begin(), kSha1DigestInfo.end(), block.begin()));
    const KeyContext context(EVP_PKEY_CTX_new_from_pkey(nullptr, _key.get(), nullptr));
    return context && EVP_PKEY_verify_init(context.get()) == 1 &&
           EVP_PKEY_CTX_set_rsa_padding(context.get(), RSA_PKCS1_PADDING) == 1 &&
           EVP_PKEY_verify(context.get(), signature.data(), signature.size(), block.data(), block.size()) == 1;
  }

 private:
  const Key _key;  // constant after construction
};

// Returns whether the key's signatures prove anything: with an exponent of 1, for one, anyone could make them.
bool isUsable(EVP_PKEY* key) {
  if (EVP_PKEY_is_a(key, "RSA") != 1) return false;
  const KeyContext context(EVP_PKEY_CTX_new_from_pkey(nullptr, key, nullptr));
  return context && EVP_PKEY_public_check(context.get()) == 1;
}

}  // namespace

std::array<std::uint8_t, 20> sha1(std::span<const std::uint8_t> bytes) {
  static const EVP_MD* const algorithm = EVP_MD_fetch(nullptr, "SHA1", nullptr);
  thread_local DigestContext context;
  return digest<20>(algorithm, "SHA-1", context, bytes);
}

std::array<std::uint8_t, 32> sha256(std::span<const std::uint8_t> bytes) {
  static const EVP_MD* const algorithm = EVP_MD_fetch(nullptr, "SHA256", nullptr);
  thread_local DigestContext context;
  return digest<32>(algorithm, "SHA-256", context, bytes);
}

std::unique_ptr<RsaPublicKey> RsaPublicKey::fromDer(std::span<const std::uint8_t> der) {
  const ErrorQueueMark mark;
  const auto length = static_cast<long>(der.size());
  const std::uint8_t* const end = der.data() + der.size();
  const std::uint8_t* at = der.data();
  Key key(d2i_PUBKEY(nullptr, &at, length));
  if (!key) {
    at = der.data();
    key.reset(d2i_PublicKey(EVP_PKEY_RSA, nullptr, &at, length));
  }
  if (!key || at != end || !isUsable(key.get())) return nullptr;
  return std::make_unique<OpenSslRsaPublicKey>(std::move(key));
}

std::array<std::uint8_t, 16> randomUuid() {
  std::array<std::uint8_t, 16> uuid{};
  uuid_generate_random(uuid.data());
  return uuid;
}

std::string uuidText(const std::array<std::uint8_t, 16>& uuid) {
  std::array<char, UUID_STR_LEN> text{};
  uuid_unparse_upper(uuid.data(), text.data());
  return text.data();
}

}  // namespace orvanta::platform
