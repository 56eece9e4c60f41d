// An RSA key of the test's own, able to sign as it should be done and in every way that it should not.
#pragma once

#include <openssl/evp.h>

#include <memory>
#include <string>
#include <string_view>

namespace veltrad {

class RSAKey {
 public:
  static RSAKey generate(int bits = 2'048, unsigned exponent = 65'537);
  // One for the whole test program: making a key is slow.
  static const RSAKey& shared();

  std::string sign(std::string_view bytes, const char* digest = "SHA1") const;
  // The private operation over a block as long as the modulus, without any padding.
  std::string signBlock(std::string_view block) const;
  std::size_t bytes() const { return static_cast<std::size_t>(EVP_PKEY_get_size(_key.get())); }

  std::string subjectPublicKeyInfo() const { return encoded("SubjectPublicKeyInfo", EVP_PKEY_PUBLIC_KEY); }
  std::string rsaPublicKey() const { return encoded("type-specific", EVP_PKEY_PUBLIC_KEY); }
  std::string rsaPrivateKey() const { return encoded("type-specific", EVP_PKEY_KEYPAIR); }
  std::string privateKeyInfo() const { return encoded("PrivateKeyInfo", EVP_PKEY_KEYPAIR); }
  std::string publicPEM() const { return encoded("SubjectPublicKeyInfo", EVP_PKEY_PUBLIC_KEY, "PEM"); }

 private:
  explicit RSAKey(EVP_PKEY* key) : _key(key, EVP_PKEY_free) {}
  std::string encoded(const char* structure, int selection, const char* form = "DER") const;
  std::shared_ptr<EVP_PKEY> _key;
};

std::string sha1(std::string_view bytes);
// SubjectPublicKeyInfo of a public key nobody has the other half of.
std::string publicKeyOfSize(int bits, unsigned exponent = 65'537);
// SubjectPublicKeyInfo of a key of another algorithm: "EC", or "RSA-PSS".
std::string publicKeyOfAlgorithm(const char* algorithm);
// The smallest number whose cube starts with `block`'s bytes, as a signature of its length: what a forger
// against exponent 3 sends when `block` ends in bytes that a careless verifier does not look at.
std::string cubeRootOf(std::string_view block);
// The cube, in as many bytes.
std::string cubeOf(std::string_view signature);

}  // namespace veltrad
