// The test's own RSA key, by OpenSSL.
#include "rsa_key.h"

#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/encoder.h>
#include <openssl/param_build.h>
#include <openssl/rsa.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace veltrad {
namespace {

void must(bool done, const char* what) {
  if (done) return;
  std::fprintf(stderr, "rsa_key: %s failed\n", what);
  std::abort();
}

using KeyContext = std::unique_ptr<EVP_PKEY_CTX, decltype(&EVP_PKEY_CTX_free)>;
using Number = std::unique_ptr<BIGNUM, decltype(&BN_free)>;

const unsigned char* in(std::string_view text) {
  return reinterpret_cast<const unsigned char*>(text.data());
}
unsigned char* out(std::string& text) {
  return reinterpret_cast<unsigned char*>(text.data());
}

Number number(std::string_view bytes) {
  return {BN_bin2bn(in(bytes), static_cast<int>(bytes.size()), nullptr), BN_free};
}

std::string bytesOf(const BIGNUM* number, std::size_t length) {
  std::string bytes(length, '\0');
  must(BN_bn2binpad(number, out(bytes), static_cast<int>(length)) >= 0, "BN_bn2binpad");
  return bytes;
}

std::string encodedKey(EVP_PKEY* key, const char* structure, int selection, const char* form) {
  const std::unique_ptr<OSSL_ENCODER_CTX, decltype(&OSSL_ENCODER_CTX_free)> encoder(
      OSSL_ENCODER_CTX_new_for_pkey(key, selection, form, structure, nullptr), OSSL_ENCODER_CTX_free);
  unsigned char* bytes = nullptr;
  std::size_t length = 0;
  must(OSSL_ENCODER_to_data(encoder.get(), &bytes, &length) == 1, structure);
  std::string text(reinterpret_cast<char*>(bytes), length);
  OPENSSL_free(bytes);
  return text;
}

void cube(BIGNUM* result, const BIGNUM* root, BN_CTX* context) {
  must(BN_sqr(result, root, context) == 1 && BN_mul(result, result, root, context) == 1, "cube");
}

}  // namespace

RSAKey RSAKey::generate(int bits, unsigned exponent) {
  const KeyContext context(EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr), EVP_PKEY_CTX_free);
  const Number e(BN_new(), BN_free);
  EVP_PKEY* key = nullptr;
  must(BN_set_word(e.get(), exponent) == 1 && EVP_PKEY_keygen_init(context.get()) == 1 &&
           EVP_PKEY_CTX_set_rsa_keygen_bits(context.get(), bits) == 1 &&
           EVP_PKEY_CTX_set1_rsa_keygen_pubexp(context.get(), e.get()) == 1 &&
           EVP_PKEY_generate(context.get(), &key) == 1,
       "generate");
  return RSAKey(key);
}

const RSAKey& RSAKey::shared() {
  static const RSAKey key = generate();
  return key;
}

std::string RSAKey::sign(std::string_view bytes, const char* digest) const {
  const std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  std::string signature(this->bytes(), '\0');
  std::size_t length = signature.size();
  must(EVP_DigestSignInit_ex(context.get(), nullptr, digest, nullptr, nullptr, _key.get(), nullptr) == 1 &&
           EVP_DigestSign(context.get(), out(signature), &length, in(bytes), bytes.size()) == 1,
       "sign");
  return signature;
}

std::string RSAKey::signBlock(std::string_view block) const {
  const KeyContext context(EVP_PKEY_CTX_new(_key.get(), nullptr), EVP_PKEY_CTX_free);
  std::string signature(bytes(), '\0');
  std::size_t length = signature.size();
  must(EVP_PKEY_sign_init(context.get()) == 1 &&
           EVP_PKEY_CTX_set_rsa_padding(context.get(), RSA_NO_PADDING) == 1 &&
           EVP_PKEY_sign(context.get(), out(signature), &length, in(block), block.size()) == 1,
       "signBlock");
  return signature;
}

std::string RSAKey::encoded(const char* structure, int selection, const char* form) const {
  return encodedKey(_key.get(), structure, selection, form);
}

std::string sha1(std::string_view bytes) {
  std::string digest(20, '\0');
  must(EVP_Digest(bytes.data(), bytes.size(), out(digest), nullptr, EVP_sha1(), nullptr) == 1, "sha1");
  return digest;
}

std::string publicKeyOfSize(int bits, unsigned exponent) {
  const Number modulus(BN_new(), BN_free);
  const Number e(BN_new(), BN_free);
  must(BN_rand(modulus.get(), bits, BN_RAND_TOP_ONE, BN_RAND_BOTTOM_ODD) == 1 &&
           BN_set_word(e.get(), exponent) == 1,
       "modulus");
  OSSL_PARAM_BLD* builder = OSSL_PARAM_BLD_new();
  OSSL_PARAM_BLD_push_BN(builder, OSSL_PKEY_PARAM_RSA_N, modulus.get());
  OSSL_PARAM_BLD_push_BN(builder, OSSL_PKEY_PARAM_RSA_E, e.get());
  OSSL_PARAM* parameters = OSSL_PARAM_BLD_to_param(builder);
  const KeyContext context(EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr), EVP_PKEY_CTX_free);
  EVP_PKEY* key = nullptr;
  must(EVP_PKEY_fromdata_init(context.get()) == 1 &&
           EVP_PKEY_fromdata(context.get(), &key, EVP_PKEY_PUBLIC_KEY, parameters) == 1,
       "fromdata");
  std::string der = encodedKey(key, "SubjectPublicKeyInfo", EVP_PKEY_PUBLIC_KEY, "DER");
  EVP_PKEY_free(key);
  OSSL_PARAM_free(parameters);
  OSSL_PARAM_BLD_free(builder);
  return der;
}

std::string publicKeyOfAlgorithm(const char* algorithm) {
  const KeyContext context(EVP_PKEY_CTX_new_from_name(nullptr, algorithm, nullptr), EVP_PKEY_CTX_free);
  EVP_PKEY* key = nullptr;
  must(EVP_PKEY_keygen_init(context.get()) == 1, algorithm);
  if (std::strcmp(algorithm, "EC") == 0)
    must(EVP_PKEY_CTX_set_group_name(context.get(), "P-256") == 1, algorithm);
  must(EVP_PKEY_generate(context.get(), &key) == 1, algorithm);
  std::string der = encodedKey(key, "SubjectPublicKeyInfo", EVP_PKEY_PUBLIC_KEY, "DER");
  EVP_PKEY_free(key);
  return der;
}

std::string cubeRootOf(std::string_view block) {
  const std::unique_ptr<BN_CTX, decltype(&BN_CTX_free)> context(BN_CTX_new(), BN_CTX_free);
  const Number target = number(block);
  const Number root(BN_new(), BN_free), cubed(BN_new(), BN_free);
  BN_zero(root.get());
  for (int bit = BN_num_bits(target.get()) / 3 + 1; bit >= 0; --bit) {
    BN_set_bit(root.get(), bit);
    cube(cubed.get(), root.get(), context.get());
    if (BN_cmp(cubed.get(), target.get()) > 0) BN_clear_bit(root.get(), bit);
  }
  BN_add_word(root.get(), 1);  // the root was rounded down, the block must not be undercut
  return bytesOf(root.get(), block.size());
}

std::string cubeOf(std::string_view signature) {
  const std::unique_ptr<BN_CTX, decltype(&BN_CTX_free)> context(BN_CTX_new(), BN_CTX_free);
  const Number root = number(signature);
  const Number cubed(BN_new(), BN_free);
  cube(cubed.get(), root.get(), context.get());
  return bytesOf(cubed.get(), signature.size());
}

}  // namespace veltrad
