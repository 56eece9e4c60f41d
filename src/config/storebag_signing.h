// Keys that sign storebags, and the container that carries a signed one. The daemon never signs; any thread.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"

struct evp_pkey_st;

namespace veltrad::config {

// An RSA private key; copies share it. Signs with PKCS#1 v1.5 over SHA-1, which is what the daemon verifies.
class SigningKey {
 public:
  static constexpr int kFewestBits = 2'048;
  static constexpr int kMostBits = 8'192;

  // Aborts when `bits` is out of bounds or the system has no randomness to give.
  static SigningKey generate(int bits = kFewestBits);
  // A private key in PEM (PKCS#8 or PKCS#1, not encrypted) of a size in bounds. The error names the path and
  // what was expected.
  static Result<SigningKey, std::string> load(const std::string& path);

  std::string privatePEM() const;  // PKCS#8
  std::string publicDER() const;   // SubjectPublicKeyInfo
  // As long as the modulus, over the SHA-1 digest of `bag`.
  std::string sign(std::string_view bag) const;

 private:
  explicit SigningKey(std::shared_ptr<evp_pkey_st> key);
  std::shared_ptr<evp_pkey_st> _key;
};

// The container around the storebag, written as a property list in XML form: itself one, with the base64
// texts "signature" and "bag".
std::string makeStorebagContainer(const SigningKey& key, const Dictionary& storebag);
// The same around bag bytes as they are.
std::string makeStorebagContainerAround(const SigningKey& key, std::string_view bag);

}  // namespace veltrad::config
