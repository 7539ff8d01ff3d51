#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>

#include "foundation/Data.h"
#include "foundation/Error.h"

// Digests and signatures.
namespace telvane::crypto {

using SHA1Digest = std::array<uint8_t, 20>;
using SHA256Digest = std::array<uint8_t, 32>;

SHA1Digest sha1(std::span<const uint8_t> bytes);
SHA256Digest sha256(std::span<const uint8_t> bytes);
SHA1Digest hmacSHA1(std::span<const uint8_t> key, std::span<const uint8_t> bytes);
SHA256Digest hmacSHA256(std::span<const uint8_t> key, std::span<const uint8_t> bytes);
std::string lowercaseHex(std::span<const uint8_t> bytes);

// An RSA public key. A value.
class PublicKey {
 public:
  // Reads DER, as SubjectPublicKeyInfo (RFC 5280) or RSAPublicKey (RFC 8017, PKCS#1). Nothing when it is neither.
  static std::optional<PublicKey> fromDER(const Data& der);
  // Verifies a PKCS#1 v1.5 signature over a SHA-1 digest that the caller has computed.
  bool verifySHA1(const SHA1Digest& digest, const Data& signature) const;
  // Identifies the key object in log lines.
  const void* address() const noexcept;

 private:
  struct Implementation;
  explicit PublicKey(std::shared_ptr<const Implementation> implementation);
  std::shared_ptr<const Implementation> _implementation;
};

// An RSA private key, for the tools that sign bags. A value.
class PrivateKey {
 public:
  static Result<PrivateKey> generate(int bits = 2048);
  static Result<PrivateKey> fromPEM(const Data& pem);  // PKCS#8 or PKCS#1, unencrypted
  Data pem() const;                                    // PKCS#8
  Data publicKeyDER() const;                           // SubjectPublicKeyInfo
  Result<Data> signSHA1(std::span<const uint8_t> message) const;

 private:
  struct Implementation;
  explicit PrivateKey(std::shared_ptr<const Implementation> implementation);
  std::shared_ptr<const Implementation> _implementation;
};

}  // namespace telvane::crypto
