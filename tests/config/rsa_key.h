// SPDX-License-Identifier: Apache-2.0
// A test key that can make correct signatures and all kinds of wrong ones.
#pragma once

#include <gtest/gtest.h>
#include <openssl/ec.h>
#include <openssl/encoder.h>
#include <openssl/evp.h>
#include <openssl/rsa.h>

#include <memory>
#include <string>
#include <string_view>

namespace veltrad {

inline const unsigned char* in(std::string_view text) {
  return reinterpret_cast<const unsigned char*>(text.data());
}
inline unsigned char* out(std::string& text) {
  return reinterpret_cast<unsigned char*>(text.data());
}

inline std::string digestOf(std::string_view bytes, const EVP_MD* algorithm = EVP_sha1()) {
  std::string digest(static_cast<std::size_t>(EVP_MD_get_size(algorithm)), '\0');
  EXPECT_EQ(EVP_Digest(bytes.data(), bytes.size(), out(digest), nullptr, algorithm, nullptr), 1);
  return digest;
}

class RSAKey {
 public:
  explicit RSAKey(EVP_PKEY* key) : _key(key, EVP_PKEY_free) {}
  // One for the whole test program: making a key is slow.
  static const RSAKey& shared() {
    static const RSAKey key(EVP_RSA_gen(2'048u));
    return key;
  }

  std::string sign(std::string_view bytes, const EVP_MD* digest = EVP_sha1()) const {
    return privateOperation(digestOf(bytes, digest), RSA_PKCS1_PADDING, digest);
  }
  // Over a block as long as the modulus, whatever it is padded with.
  std::string signBlock(std::string_view block) const {
    return privateOperation(block, RSA_NO_PADDING, nullptr);
  }
  EVP_PKEY* get() const { return _key.get(); }
  std::size_t size() const { return static_cast<std::size_t>(EVP_PKEY_get_size(_key.get())); }

  std::string encoded(const char* structure = "SubjectPublicKeyInfo", int selection = EVP_PKEY_PUBLIC_KEY,
                      const char* form = "DER") const {
    const std::shared_ptr<OSSL_ENCODER_CTX> encoder(
        OSSL_ENCODER_CTX_new_for_pkey(_key.get(), selection, form, structure, nullptr),
        OSSL_ENCODER_CTX_free);
    unsigned char* bytes = nullptr;
    std::size_t length = 0;
    EXPECT_EQ(OSSL_ENCODER_to_data(encoder.get(), &bytes, &length), 1) << structure;
    std::string text(reinterpret_cast<char*>(bytes), length);
    OPENSSL_free(bytes);
    return text;
  }

 private:
  std::string privateOperation(std::string_view block, int padding, const EVP_MD* digest) const {
    const std::shared_ptr<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new(_key.get(), nullptr), EVP_PKEY_CTX_free);
    std::string signature(size(), '\0');
    std::size_t length = signature.size();
    EXPECT_TRUE(EVP_PKEY_sign_init(context.get()) == 1 &&
                EVP_PKEY_CTX_set_rsa_padding(context.get(), padding) == 1 &&
                (digest == nullptr || EVP_PKEY_CTX_set_signature_md(context.get(), digest) == 1) &&
                EVP_PKEY_sign(context.get(), out(signature), &length, in(block), block.size()) == 1);
    return signature;
  }
  std::shared_ptr<EVP_PKEY> _key;
};

}  // namespace veltrad
