// SPDX-License-Identifier: Apache-2.0
// Keys that sign storebags, and the signed container, for tools; the daemon never signs.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "base/value.h"

struct evp_pkey_st;

namespace veltrad::config {

// A private key, shared by copies. RSA signs with PKCS#1 v1.5 and SHA-1, which the daemon verifies; Ed25519
// signs beside it.
class SigningKey {
 public:
  static constexpr int kFewestBits = 2'048;
  static constexpr int kMostBits = 8'192;

  // Aborts if `bits` is out of bounds or the system has no random bytes.
  static SigningKey generate(int bits = kFewestBits);
  // From a PEM file (PKCS#8 or PKCS#1, not encrypted). The error names the path and what was expected.
  static Result<SigningKey, std::string> load(const std::string& path);

  // The same for Ed25519 (PKCS#8).
  static SigningKey generateEd25519();
  static Result<SigningKey, std::string> loadEd25519(const std::string& path);

  // PKCS#8.
  std::string privatePEM() const;
  // SubjectPublicKeyInfo.
  std::string publicDER() const;
  // As in StorebagKey.
  std::string fingerprint() const;
  // The signature of `bag`.
  std::string sign(std::string_view bag) const;

 private:
  explicit SigningKey(std::shared_ptr<evp_pkey_st> key);
  std::shared_ptr<evp_pkey_st> _key;
};

// An XML property list with the base64 texts "signature" and "bag", the latter of the storebag in XML form.
std::string makeStorebagContainer(const SigningKey& key, const Dictionary& storebag);
// The same for a bag of any bytes. With Ed25519 keys in `further`, "signatures" holds theirs.
std::string makeStorebagContainerAround(const SigningKey& key, std::string_view bag,
                                        const std::vector<SigningKey>& further = {});

}  // namespace veltrad::config
