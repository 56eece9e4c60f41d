// SPDX-License-Identifier: Apache-2.0
// Makes the certificate with OpenSSL.
#include "certificate.h"

#include <openssl/bio.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/rand.h>
#include <openssl/x509v3.h>

#include <cstdint>

#include "base/freed.h"
#include "platform/file_store.h"

namespace veltrad::lab {
namespace {

using Key = Owned<EVP_PKEY, EVP_PKEY_free>;
using Certificate = Owned<X509, X509_free>;
using Extension = Owned<X509_EXTENSION, X509_EXTENSION_free>;
using Memory = Owned<BIO, BIO_free>;

constexpr long kDay = 24L * 60 * 60;

bool addExtension(X509* certificate, int kind, const char* value) {
  X509V3_CTX context;
  X509V3_set_ctx_nodb(&context);
  X509V3_set_ctx(&context, certificate, certificate, nullptr, nullptr, 0);
  const Extension extension(X509V3_EXT_conf_nid(nullptr, &context, kind, value));
  return extension && X509_add_ext(certificate, extension.get(), -1) == 1;
}

bool name(X509* certificate) {
  X509_NAME* subject = X509_get_subject_name(certificate);
  const auto* text = reinterpret_cast<const unsigned char*>("veltra-lab");
  return X509_NAME_add_entry_by_txt(subject, "CN", MBSTRING_UTF8, text, -1, -1, 0) == 1 &&
         X509_set_issuer_name(certificate, subject) == 1;
}

Certificate certificateFor(EVP_PKEY* key) {
  Certificate made(X509_new());
  std::uint32_t serial = 0;
  if (!made || RAND_bytes(reinterpret_cast<unsigned char*>(&serial), sizeof serial) != 1) return nullptr;
  const bool done = X509_set_version(made.get(), X509_VERSION_3) == 1 &&
                    ASN1_INTEGER_set_uint64(X509_get_serialNumber(made.get()), serial) == 1 &&
                    X509_gmtime_adj(X509_getm_notBefore(made.get()), -kDay) &&
                    X509_gmtime_adj(X509_getm_notAfter(made.get()), 3650 * kDay) &&
                    X509_set_pubkey(made.get(), key) == 1 && name(made.get()) &&
                    addExtension(made.get(), NID_basic_constraints, "critical,CA:TRUE") &&
                    addExtension(made.get(), NID_subject_key_identifier, "hash") &&
                    addExtension(made.get(), NID_subject_alt_name, "DNS:localhost,IP:127.0.0.1,IP:::1") &&
                    X509_sign(made.get(), key, EVP_sha256()) > 0;
  return done ? std::move(made) : nullptr;
}

std::string bytesOf(BIO* memory) {
  const char* start = nullptr;
  const long length = BIO_get_mem_data(memory, &start);
  return length > 0 ? std::string(start, static_cast<std::size_t>(length)) : std::string();
}

}  // namespace

std::optional<std::string> makeCertificate(const std::string& certificatePath, const std::string& keyPath) {
  const Key key(EVP_EC_gen("P-256"));
  const Certificate certificate = key ? certificateFor(key.get()) : nullptr;
  const Memory keyText(BIO_new(BIO_s_mem()));
  const Memory certificateText(BIO_new(BIO_s_mem()));
  if (!certificate || !keyText || !certificateText ||
      PEM_write_bio_PrivateKey(keyText.get(), key.get(), nullptr, nullptr, 0, nullptr, nullptr) != 1 ||
      PEM_write_bio_X509(certificateText.get(), certificate.get()) != 1)
    return "OpenSSL could not make a certificate for localhost";
  platform::DiskFileStore files;
  if (const auto written = files.replace(keyPath, bytesOf(keyText.get()), 0600); !written)
    return written.error().description;
  if (const auto written = files.replace(certificatePath, bytesOf(certificateText.get()), 0644); !written)
    return written.error().description;
  return std::nullopt;
}

}  // namespace veltrad::lab
