// SPDX-License-Identifier: Apache-2.0
// Keys that sign storebags, and the signed container, for tools; the daemon never signs.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"

struct evp_pkey_st;

namespace veltrad::config {

// An RSA private key, shared by copies. Signs with PKCS#1 v1.5 and SHA-1, which the daemon verifies.
class SigningKey {
 public:
  static constexpr int kFewestBits = 2'048;
  static constexpr int kMostBits = 8'192;

  // Aborts if `bits` is out of bounds or the system has no random bytes.
  static SigningKey generate(int bits = kFewestBits);
  // From a PEM file (PKCS#8 or PKCS#1, not encrypted). The error names the path and what was expected.
  static Result<SigningKey, std::string> load(const std::string& path);

  // PKCS#8.
  std::string privatePEM() const;
  // SubjectPublicKeyInfo.
  std::string publicDER() const;
  // The signature over the SHA-1 digest of `bag`.
  std::string sign(std::string_view bag) const;

 private:
  explicit SigningKey(std::shared_ptr<evp_pkey_st> key);
  std::shared_ptr<evp_pkey_st> _key;
};

// An XML property list with the base64 texts "signature" and "bag", the latter of the storebag in XML form.
std::string makeStorebagContainer(const SigningKey& key, const Dictionary& storebag);
// The same for a bag of any bytes.
std::string makeStorebagContainerAround(const SigningKey& key, std::string_view bag);

}  // namespace veltrad::config
