#include "platform/Crypto.h"

#include <openssl/bio.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/hmac.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <cerrno>
#include <exception>
#include <vector>

#include "platform/system/PlatformError.h"

namespace telvane::crypto {
namespace {

constexpr char kHexadecimalDigits[] = "0123456789abcdef";
constexpr size_t kLargestKeyFile = 64u << 10;

struct Freeing {
  void operator()(EVP_PKEY* key) const noexcept { EVP_PKEY_free(key); }
  void operator()(EVP_PKEY_CTX* context) const noexcept { EVP_PKEY_CTX_free(context); }
  void operator()(EVP_MD_CTX* context) const noexcept { EVP_MD_CTX_free(context); }
  void operator()(BIO* bio) const noexcept { BIO_free(bio); }
  void operator()(unsigned char* bytes) const noexcept { OPENSSL_free(bytes); }
};
template <class T>
using Owned = std::unique_ptr<T, Freeing>;

// The library fails here only without memory or without its own algorithms: nothing that the process could go on with.
void require(bool success) {
  if (!success) std::terminate();
}

template <class Digest>
Digest digest(const EVP_MD* algorithm, std::span<const uint8_t> bytes) {
  Digest result;
  require(EVP_Digest(bytes.data(), bytes.size(), result.data(), nullptr, algorithm, nullptr) == 1);
  return result;
}

template <class Digest>
Digest hmac(const EVP_MD* algorithm, std::span<const uint8_t> key, std::span<const uint8_t> bytes) {
  Digest result;
  const uint8_t none = 0;  // no key at all would mean the key of the call before
  require(HMAC(algorithm, key.empty() ? &none : key.data(), static_cast<int>(key.size()), bytes.data(), bytes.size(),
               result.data(), nullptr) != nullptr);
  return result;
}

Error libraryError(const std::string& what) {
  const unsigned long code = ERR_peek_last_error();
  const char* reason = code == 0 ? nullptr : ERR_reason_error_string(code);
  ERR_clear_error();
  return platformError(EINVAL, reason == nullptr ? what : what + ": " + reason);
}

bool isRSA(const EVP_PKEY* key) { return key != nullptr && EVP_PKEY_get_base_id(key) == EVP_PKEY_RSA; }

using DecodeFunction = EVP_PKEY* (*)(EVP_PKEY**, const unsigned char**, long);

EVP_PKEY* decodePKCS1(EVP_PKEY** key, const unsigned char** bytes, long size) {
  return d2i_PublicKey(EVP_PKEY_RSA, key, bytes, size);
}

// Returns null unless the whole input is one RSA key.
Owned<EVP_PKEY> decode(DecodeFunction function, const Data& der) {
  const unsigned char* next = der.bytes();
  Owned<EVP_PKEY> key(function(nullptr, &next, static_cast<long>(der.size())));
  ERR_clear_error();
  const bool isWhole = next == der.bytes() + der.size();
  return isRSA(key.get()) && isWhole ? std::move(key) : nullptr;
}

// Keys with a pass phrase are not for programs that run without a person; the library would ask on the terminal.
int refusePassphrase(char*, int, int, void*) { return -1; }

Data contentOf(BIO* bio) {
  char* bytes = nullptr;
  const long size = BIO_get_mem_data(bio, &bytes);
  return size <= 0 ? Data() : Data::copyOf(std::string_view(bytes, static_cast<size_t>(size)));
}

}  // namespace

SHA1Digest sha1(std::span<const uint8_t> bytes) { return digest<SHA1Digest>(EVP_sha1(), bytes); }

SHA256Digest sha256(std::span<const uint8_t> bytes) {
  // Fetched once: to look the algorithm up costs more than to digest a short text with it.
  static const EVP_MD* const algorithm = EVP_MD_fetch(nullptr, "SHA256", nullptr);
  require(algorithm != nullptr);
  return digest<SHA256Digest>(algorithm, bytes);
}

SHA1Digest hmacSHA1(std::span<const uint8_t> key, std::span<const uint8_t> bytes) {
  return hmac<SHA1Digest>(EVP_sha1(), key, bytes);
}

SHA256Digest hmacSHA256(std::span<const uint8_t> key, std::span<const uint8_t> bytes) {
  return hmac<SHA256Digest>(EVP_sha256(), key, bytes);
}

std::string lowercaseHex(std::span<const uint8_t> bytes) {
  std::string text;
  text.reserve(bytes.size() * 2);
  for (const uint8_t byte : bytes) {
    text += kHexadecimalDigits[byte >> 4];
    text += kHexadecimalDigits[byte & 15];
  }
  return text;
}

struct PublicKey::Implementation {
  Owned<EVP_PKEY> key;
};

PublicKey::PublicKey(std::shared_ptr<const Implementation> implementation)
    : _implementation(std::move(implementation)) {}

std::optional<PublicKey> PublicKey::fromDER(const Data& der) {
  if (der.empty() || der.size() > kLargestKeyFile) return std::nullopt;
  Owned<EVP_PKEY> key = decode(d2i_PUBKEY, der);
  if (!key) key = decode(decodePKCS1, der);
  if (!key) return std::nullopt;
  return PublicKey(std::make_shared<const Implementation>(Implementation{std::move(key)}));
}

bool PublicKey::verifySHA1(const SHA1Digest& digest, const Data& signature) const {
  const Owned<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new(_implementation->key.get(), nullptr));
  const bool isReady = context && EVP_PKEY_verify_init(context.get()) == 1 &&
                       EVP_PKEY_CTX_set_rsa_padding(context.get(), RSA_PKCS1_PADDING) == 1 &&
                       EVP_PKEY_CTX_set_signature_md(context.get(), EVP_sha1()) == 1;
  const bool isVerified =
      isReady && EVP_PKEY_verify(context.get(), signature.bytes(), signature.size(), digest.data(), digest.size()) == 1;
  ERR_clear_error();
  return isVerified;
}

const void* PublicKey::address() const noexcept { return _implementation.get(); }

struct PrivateKey::Implementation {
  Owned<EVP_PKEY> key;
};

PrivateKey::PrivateKey(std::shared_ptr<const Implementation> implementation)
    : _implementation(std::move(implementation)) {}

Result<PrivateKey> PrivateKey::generate(int bits) {
  if (bits <= 0) return platformError(EINVAL, "Cannot make an RSA key of no size");
  Owned<EVP_PKEY> key(EVP_RSA_gen(static_cast<size_t>(bits)));
  if (!key) return libraryError("Cannot make an RSA key");
  return PrivateKey(std::make_shared<const Implementation>(Implementation{std::move(key)}));
}

Result<PrivateKey> PrivateKey::fromPEM(const Data& pem) {
  if (pem.size() > kLargestKeyFile) return platformError(EFBIG, "Cannot read the private key: it is too large");
  const Owned<BIO> bio(BIO_new_mem_buf(pem.bytes(), static_cast<int>(pem.size())));
  Owned<EVP_PKEY> key(PEM_read_bio_PrivateKey(bio.get(), nullptr, refusePassphrase, nullptr));
  if (!key) return libraryError("Cannot read the private key (PEM without a pass phrase is needed)");
  if (!isRSA(key.get())) return platformError(EINVAL, "Cannot use the private key: it is no RSA key");
  return PrivateKey(std::make_shared<const Implementation>(Implementation{std::move(key)}));
}

Data PrivateKey::pem() const {
  const Owned<BIO> bio(BIO_new(BIO_s_mem()));
  require(bio && PEM_write_bio_PKCS8PrivateKey(bio.get(), _implementation->key.get(), nullptr, nullptr, 0, nullptr,
                                               nullptr) == 1);
  return contentOf(bio.get());
}

Data PrivateKey::publicKeyDER() const {
  unsigned char* bytes = nullptr;
  const int size = i2d_PUBKEY(_implementation->key.get(), &bytes);
  require(size > 0);
  const Owned<unsigned char> owned(bytes);
  return Data::copyOf(std::span<const uint8_t>(bytes, static_cast<size_t>(size)));
}

Result<Data> PrivateKey::signSHA1(std::span<const uint8_t> message) const {
  const Owned<EVP_MD_CTX> context(EVP_MD_CTX_new());
  std::vector<uint8_t> signature(static_cast<size_t>(EVP_PKEY_get_size(_implementation->key.get())));
  size_t size = signature.size();
  const bool isSigned =
      context && EVP_DigestSignInit(context.get(), nullptr, EVP_sha1(), nullptr, _implementation->key.get()) == 1 &&
      EVP_DigestSign(context.get(), signature.data(), &size, message.data(), message.size()) == 1;
  if (!isSigned) return libraryError("Cannot sign");
  signature.resize(size);
  return Data(std::move(signature));
}

}  // namespace telvane::crypto
