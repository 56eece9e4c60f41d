// The certificate authorities that HTTPS connections trust. HTTP thread.
#include "platform/trust_store.h"

#include <openssl/err.h>
#include <openssl/x509.h>
#include <openssl/x509_vfy.h>
#include <unistd.h>

#include "platform/log.h"

namespace veltrad::platform {

bool TrustStore::Stamp::operator==(const Stamp& other) const {
  return device == other.device && file == other.file && size == other.size &&
         modified.tv_sec == other.modified.tv_sec && modified.tv_nsec == other.modified.tv_nsec;
}

void TrustStore::Free::operator()(X509_STORE* store) const {
  X509_STORE_free(store);
}

TrustStore::TrustStore(std::string extraCertificatesPath)
    : _extraCertificatesPath(std::move(extraCertificatesPath)) {}

TrustStore::~TrustStore() = default;

X509_STORE* TrustStore::current() {
  const Stamp now = stampNow();  // before the reading: a file that changes meanwhile is read again
  if (!_store || !(now == _stamp)) {
    _store = make(now.size >= 0);
    _stamp = now;
  }
  return _store.get();
}

TrustStore::Stamp TrustStore::stampNow() const {
  struct stat found {};
  if (_extraCertificatesPath.empty() || stat(_extraCertificatesPath.c_str(), &found) != 0) return {};
  return {found.st_dev, found.st_ino, found.st_size, found.st_mtim};
}

TrustStore::Store TrustStore::make(bool withExtra) const {
  Store store(X509_STORE_new());
  if (!store) return store;
  // As libcurl sets them: a trusted certificate ends the chain, whoever issued it.
  X509_STORE_set_flags(store.get(), X509_V_FLAG_TRUSTED_FIRST | X509_V_FLAG_PARTIAL_CHAIN);
  X509_STORE_load_path(store.get(), X509_get_default_cert_dir());
  const char* bundle = X509_get_default_cert_file();  // not every system has one beside its directory
  if (access(bundle, R_OK) == 0) X509_STORE_load_file(store.get(), bundle);
  ERR_clear_error();
  if (withExtra && X509_STORE_load_file(store.get(), _extraCertificatesPath.c_str()) != 1) {
    const char* reason = ERR_reason_error_string(ERR_peek_last_error());
    logWarning("Extra certificates in %s cannot be used (%s): expected PEM certificates",
               _extraCertificatesPath.c_str(), reason != nullptr ? reason : "unreadable");
  }
  ERR_clear_error();
  return store;
}

}  // namespace veltrad::platform
