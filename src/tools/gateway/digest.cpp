// SPDX-License-Identifier: Apache-2.0
// Uses OpenSSL.
#include "gateway/digest.h"

#include <openssl/evp.h>

#include <new>

#include "base/text.h"

namespace veltrad::gateway {

Digest::Digest() : _context(EVP_MD_CTX_new(), EVP_MD_CTX_free) {
  if (!_context || EVP_DigestInit_ex(_context.get(), EVP_sha256(), nullptr) != 1) throw std::bad_alloc();
}

void Digest::add(std::string_view bytes) {
  EVP_DigestUpdate(_context.get(), bytes.data(), bytes.size());
}

std::string Digest::hexDigits() {
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned length = 0;
  EVP_DigestFinal_ex(_context.get(), digest, &length);
  return hex({reinterpret_cast<const char*>(digest), length});
}

std::string digestOf(std::string_view first, std::string_view second) {
  Digest digest;
  digest.add(first);
  digest.add(second);
  return digest.hexDigits();
}

}  // namespace veltrad::gateway
