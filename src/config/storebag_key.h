// The RSA public key that storebags are verified with. Any thread; an object is used by one at a time.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace veltrad::config {

// RSA, PKCS#1 v1.5 over SHA-1 (RFC 8017, 8.2.2), in a library context of its own: no configuration file and
// no provider of the host changes what is accepted.
class StorebagKey {
 public:
  static constexpr int kFewestModulusBits = 2'048;
  static constexpr int kMostModulusBits = 8'192;

  // Either common DER form, nothing behind it: SubjectPublicKeyInfo (RFC 5280) with the plain RSA algorithm,
  // or RSAPublicKey (RFC 8017, A.1.1). Nothing for anything else, a private key included, and for a modulus
  // out of bounds.
  static std::optional<StorebagKey> fromDER(std::string_view der);

  StorebagKey(StorebagKey&&) noexcept;
  StorebagKey& operator=(StorebagKey&&) noexcept;
  ~StorebagKey();

  // True only for the signature of exactly these bytes, exactly as long as the modulus.
  bool verifies(std::string_view bag, std::string_view signature) const;

  int modulusBits() const;
  // SHA-256 of its SubjectPublicKeyInfo in DER, 64 lower-case hexadecimal digits.
  std::string fingerprint() const;
  // Tells this key object from others in log lines.
  const void* identity() const;

 private:
  struct Held;
  explicit StorebagKey(std::unique_ptr<Held> held);
  std::unique_ptr<Held> _held;
};

// False also when the key is unusable.
bool verifySignature(std::string_view publicKeyDER, std::string_view bag, std::string_view signature);

}  // namespace veltrad::config
