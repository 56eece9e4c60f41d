// SPDX-License-Identifier: Apache-2.0
// Verifies signatures with OpenSSL's EVP interface, which checks digest and padding.
#include "config/storebag_key.h"

#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/decoder.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/provider.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include "base/freed.h"
#include "base/text.h"

namespace veltrad::config {
namespace {

using LibraryContext = Owned<OSSL_LIB_CTX, OSSL_LIB_CTX_free>;
using Provider = Owned<OSSL_PROVIDER, OSSL_PROVIDER_unload>;
using PublicKey = Owned<EVP_PKEY, EVP_PKEY_free>;
using Number = Owned<BIGNUM, BN_free>;
using Decoder = Owned<OSSL_DECODER_CTX, OSSL_DECODER_CTX_free>;
using Memory = Owned<BIO, BIO_free>;
using DigestContext = Owned<EVP_MD_CTX, EVP_MD_CTX_free>;

struct OpenSSLFree {
  void operator()(void* bytes) const { OPENSSL_free(bytes); }
};

const unsigned char* bytesOf(std::string_view text) {
  return reinterpret_cast<const unsigned char*>(text.data());
}

// Removes the errors of a refusal from the thread's queue, which other code reads.
class ErrorQueueAsItWas {
 public:
  ErrorQueueAsItWas() { ERR_set_mark(); }
  ~ErrorQueueAsItWas() { ERR_pop_to_mark(); }
};

PublicKey decodeKey(std::string_view der, const char* structure, const char* algorithm,
                    OSSL_LIB_CTX* library) {
  EVP_PKEY* key = nullptr;
  const Decoder decoder(OSSL_DECODER_CTX_new_for_pkey(&key, "DER", structure, algorithm, EVP_PKEY_PUBLIC_KEY,
                                                      library, nullptr));
  const unsigned char* at = bytesOf(der);
  std::size_t left = der.size();
  const bool decoded = decoder != nullptr && OSSL_DECODER_from_data(decoder.get(), &at, &left) == 1;
  PublicKey held(key);
  return decoded && left == 0 ? std::move(held) : nullptr;
}

// The bytes of the first block of a PEM file; absent if there is none.
std::optional<std::string> firstBlock(std::string_view pem) {
  const Memory memory(BIO_new_mem_buf(pem.data(), static_cast<int>(pem.size())));
  char* name = nullptr;
  char* header = nullptr;
  unsigned char* bytes = nullptr;
  long length = 0;
  if (!memory || PEM_read_bio(memory.get(), &name, &header, &bytes, &length) != 1) return std::nullopt;
  const std::unique_ptr<unsigned char, OpenSSLFree> held(bytes);
  const std::unique_ptr<char, OpenSSLFree> heldName(name), heldHeader(header);
  return std::string(reinterpret_cast<char*>(bytes), static_cast<std::size_t>(length));
}

bool isUsable(const EVP_PKEY* key) {
  if (EVP_PKEY_is_a(key, "ED25519") == 1) return true;
  if (EVP_PKEY_is_a(key, "RSA") != 1) return false;
  const int bits = EVP_PKEY_get_bits(key);
  if (bits < StorebagKey::kFewestModulusBits || bits > StorebagKey::kMostModulusBits) return false;
  // With an exponent of 1, every padded digest is its own signature.
  BIGNUM* exponent = nullptr;
  if (EVP_PKEY_get_bn_param(key, OSSL_PKEY_PARAM_RSA_E, &exponent) != 1) return false;
  const Number held(exponent);
  return BN_is_odd(exponent) == 1 && BN_is_one(exponent) != 1;
}

}  // namespace

// Destroyed in reverse order, the key first.
struct StorebagKey::Held {
  LibraryContext library;
  Provider provider;
  PublicKey key;
};

std::optional<StorebagKey> StorebagKey::fromEither(std::string_view der, bool ed25519) {
  const ErrorQueueAsItWas errors;
  const auto held = std::make_shared<Held>();
  held->library.reset(OSSL_LIB_CTX_new());
  if (!held->library) return std::nullopt;
  held->provider.reset(OSSL_PROVIDER_load(held->library.get(), "default"));
  if (!held->provider) return std::nullopt;
  held->key = decodeKey(der, "SubjectPublicKeyInfo", "RSA", held->library.get());
  if (!held->key) held->key = decodeKey(der, "type-specific", "RSA", held->library.get());
  if (!held->key && ed25519)
    held->key = decodeKey(der, "SubjectPublicKeyInfo", "ED25519", held->library.get());
  if (!held->key || !isUsable(held->key.get())) return std::nullopt;
  return StorebagKey(held);
}

std::optional<StorebagKey> StorebagKey::fromDER(std::string_view der) {
  return fromEither(der, false);
}

std::optional<StorebagKey> StorebagKey::fromFile(std::string_view bytes) {
  constexpr std::size_t kMostBytes = 1u << 16;
  if (bytes.size() > kMostBytes) return std::nullopt;
  if (auto key = fromEither(bytes, true)) return key;
  const ErrorQueueAsItWas errors;
  const auto block = firstBlock(bytes);
  return block ? fromEither(*block, true) : std::nullopt;
}

StorebagKey::Kind StorebagKey::kind() const {
  return EVP_PKEY_is_a(_held->key.get(), "ED25519") == 1 ? Kind::ed25519 : Kind::rsa;
}

bool StorebagKey::verifies(std::string_view bag, std::string_view signature) const {
  const ErrorQueueAsItWas errors;
  EVP_PKEY* key = _held->key.get();
  if (signature.size() != static_cast<std::size_t>(EVP_PKEY_get_size(key))) return false;
  const DigestContext context(EVP_MD_CTX_new());
  if (kind() == Kind::ed25519) {
    return context != nullptr &&
           EVP_DigestVerifyInit_ex(context.get(), nullptr, nullptr, _held->library.get(), nullptr, key,
                                   nullptr) == 1 &&
           EVP_DigestVerify(context.get(), bytesOf(signature), signature.size(), bytesOf(bag), bag.size()) ==
               1;
  }
  EVP_PKEY_CTX* settings = nullptr;  // owned by `context`
  return context != nullptr &&
         EVP_DigestVerifyInit_ex(context.get(), &settings, "SHA1", _held->library.get(), nullptr, key,
                                 nullptr) == 1 &&
         EVP_PKEY_CTX_set_rsa_padding(settings, RSA_PKCS1_PADDING) == 1 &&
         EVP_DigestVerify(context.get(), bytesOf(signature), signature.size(), bytesOf(bag), bag.size()) == 1;
}

std::string StorebagKey::fingerprint() const {
  const ErrorQueueAsItWas errors;
  unsigned char* der = nullptr;
  const int size = i2d_PUBKEY(_held->key.get(), &der);
  const std::unique_ptr<unsigned char, OpenSSLFree> held(der);
  unsigned char digest[EVP_MAX_MD_SIZE];
  std::size_t length = 0;
  const bool digested = size > 0 && EVP_Q_digest(_held->library.get(), "SHA256", nullptr, der,
                                                 static_cast<std::size_t>(size), digest, &length) == 1;
  return digested ? hex({reinterpret_cast<const char*>(digest), length}) : "";
}

int StorebagKey::modulusBits() const {
  return EVP_PKEY_get_bits(_held->key.get());
}
const void* StorebagKey::identity() const {
  return _held->key.get();
}

}  // namespace veltrad::config
