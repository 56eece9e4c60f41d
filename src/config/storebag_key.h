// SPDX-License-Identifier: Apache-2.0
// A public key with which storebags are verified.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace veltrad::config {

// RSA, PKCS#1 v1.5 with SHA-1 (RFC 8017, 8.2.2), or Ed25519 (RFC 8032). Has its own library context, so that
// no configuration file and no provider of the host changes what is accepted. Copies share it; they are used
// by one thread at a time.
class StorebagKey {
 public:
  enum class Kind { rsa, ed25519 };

  static constexpr int kFewestModulusBits = 2'048;
  static constexpr int kMostModulusBits = 8'192;
  // The length of a shortened fingerprint, enough to name a key.
  static constexpr std::size_t kShortFingerprint = 16;

  // From DER with nothing after it: SubjectPublicKeyInfo (RFC 5280) with the plain RSA algorithm, or
  // RSAPublicKey (RFC 8017, A.1.1). Absent for anything else, private keys included, and if the modulus is
  // out of bounds.
  static std::optional<StorebagKey> fromDER(std::string_view der);
  // The same, or an Ed25519 key as SubjectPublicKeyInfo; in DER, or as the first block of a PEM file.
  static std::optional<StorebagKey> fromFile(std::string_view bytes);

  Kind kind() const;
  // True only for a signature of exactly these bytes that is as long as the modulus, or 64 bytes for Ed25519.
  bool verifies(std::string_view bag, std::string_view signature) const;

  int modulusBits() const;
  // SHA-256 of its SubjectPublicKeyInfo in DER, 64 lower-case hexadecimal digits.
  std::string fingerprint() const;
  // Identifies this key object in log lines.
  const void* identity() const;

 private:
  struct Held;
  static std::optional<StorebagKey> fromEither(std::string_view der, bool ed25519);
  explicit StorebagKey(std::shared_ptr<Held> held) : _held(std::move(held)) {}
  std::shared_ptr<Held> _held;
};

}  // namespace veltrad::config
