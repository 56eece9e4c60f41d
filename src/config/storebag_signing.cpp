// SPDX-License-Identifier: Apache-2.0
// Keys that sign storebags, with OpenSSL.
#include "config/storebag_signing.h"

#include <openssl/bio.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <cstdio>
#include <cstdlib>

#include "base/base64.h"
#include "base/freed.h"
#include "config/storebag_key.h"
#include "formats/property_list.h"
#include "platform/file_store.h"

namespace veltrad::config {
namespace {

using PrivateKey = std::shared_ptr<EVP_PKEY>;
using Memory = Owned<BIO, BIO_free>;

constexpr std::size_t kMostKeyFileBytes = 1u << 16;

[[noreturn]] void abortFor(const char* what) {
  std::fprintf(stderr, "signing key: OpenSSL could not %s\n", what);
  std::abort();
}

std::string contentsOf(BIO* memory) {
  char* bytes = nullptr;
  const long length = BIO_get_mem_data(memory, &bytes);
  return std::string(bytes, static_cast<std::size_t>(length));
}

// Refuses encrypted keys instead of asking for a passphrase on the terminal.
int noPassphrase(char*, int, int, void*) {
  return -1;
}

Result<PrivateKey, std::string> keyIn(const std::string& path, const char* algorithm, const char* expected) {
  platform::DiskFileStore files;
  const auto pem = files.read(path, kMostKeyFileBytes);
  if (!pem) return Failure{pem.error().description};
  const Memory memory(BIO_new_mem_buf(pem.value().data(), static_cast<int>(pem.value().size())));
  PrivateKey key(PEM_read_bio_PrivateKey(memory.get(), nullptr, noPassphrase, nullptr), EVP_PKEY_free);
  if (!key || EVP_PKEY_is_a(key.get(), algorithm) != 1)
    return Failure{path + ": expected " + expected + " private key in PEM form, not encrypted"};
  return key;
}

}  // namespace

SigningKey::SigningKey(PrivateKey key) : _key(std::move(key)) {}

SigningKey SigningKey::generate(int bits) {
  if (bits < kFewestBits || bits > kMostBits) abortFor("make a key of that size");
  PrivateKey key(EVP_RSA_gen(static_cast<unsigned>(bits)), EVP_PKEY_free);
  if (!key) abortFor("make a key");
  return SigningKey(std::move(key));
}

SigningKey SigningKey::generateEd25519() {
  PrivateKey key(EVP_PKEY_Q_keygen(nullptr, nullptr, "ED25519"), EVP_PKEY_free);
  if (!key) abortFor("make a key");
  return SigningKey(std::move(key));
}

Result<SigningKey, std::string> SigningKey::load(const std::string& path) {
  auto key = keyIn(path, "RSA", "an RSA");
  if (!key) return Failure{key.error()};
  const int bits = EVP_PKEY_get_bits(key.value().get());
  if (bits < kFewestBits || bits > kMostBits)
    return Failure{path + ": the key has " + std::to_string(bits) + " bits, expected " +
                   std::to_string(kFewestBits) + " to " + std::to_string(kMostBits)};
  return SigningKey(std::move(key).value());
}

Result<SigningKey, std::string> SigningKey::loadEd25519(const std::string& path) {
  auto key = keyIn(path, "ED25519", "an Ed25519");
  if (!key) return Failure{key.error()};
  return SigningKey(std::move(key).value());
}

std::string SigningKey::privatePEM() const {
  const Memory memory(BIO_new(BIO_s_mem()));
  if (PEM_write_bio_PKCS8PrivateKey(memory.get(), _key.get(), nullptr, nullptr, 0, nullptr, nullptr) != 1)
    abortFor("write a private key");
  return contentsOf(memory.get());
}

std::string SigningKey::publicDER() const {
  const Memory memory(BIO_new(BIO_s_mem()));
  if (i2d_PUBKEY_bio(memory.get(), _key.get()) != 1) abortFor("write a public key");
  return contentsOf(memory.get());
}

std::string SigningKey::fingerprint() const {
  const auto key = StorebagKey::fromFile(publicDER());
  if (!key) abortFor("read the public half of a key");
  return key->fingerprint();
}

std::string SigningKey::sign(std::string_view bag) const {
  const Owned<EVP_MD_CTX, EVP_MD_CTX_free> context(EVP_MD_CTX_new());
  std::string signature(static_cast<std::size_t>(EVP_PKEY_get_size(_key.get())), '\0');
  std::size_t length = signature.size();
  const bool isRSA = EVP_PKEY_is_a(_key.get(), "RSA") == 1;
  EVP_PKEY_CTX* settings = nullptr;  // owned by `context`
  const bool isSigned =
      context != nullptr &&
      EVP_DigestSignInit_ex(context.get(), &settings, isRSA ? "SHA1" : nullptr, nullptr, nullptr, _key.get(),
                            nullptr) == 1 &&
      (!isRSA || EVP_PKEY_CTX_set_rsa_padding(settings, RSA_PKCS1_PADDING) == 1) &&
      EVP_DigestSign(context.get(), reinterpret_cast<unsigned char*>(signature.data()), &length,
                     reinterpret_cast<const unsigned char*>(bag.data()), bag.size()) == 1;
  if (!isSigned) abortFor("sign");
  signature.resize(length);
  return signature;
}

std::string makeStorebagContainer(const SigningKey& key, const Dictionary& storebag) {
  return makeStorebagContainerAround(key, formats::writeXMLPropertyList(storebag));
}

std::string makeStorebagContainerAround(const SigningKey& key, std::string_view bag,
                                        const std::vector<SigningKey>& further) {
  Dictionary container{{"signature", encodeBase64(key.sign(bag))}, {"bag", encodeBase64(bag)}};
  Array signatures;
  for (const SigningKey& one : further) {
    signatures.push_back(Dictionary{{"key", one.fingerprint().substr(0, StorebagKey::kShortFingerprint)},
                                    {"ed25519", encodeBase64(one.sign(bag))}});
  }
  if (!signatures.empty()) container.set("signatures", std::move(signatures));
  return formats::writeXMLPropertyList(container);
}

}  // namespace veltrad::config
