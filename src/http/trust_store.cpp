// The certificate authorities that HTTPS connections trust. HTTP thread.
#include "http/trust_store.h"

#include <openssl/err.h>
#include <openssl/x509.h>
#include <openssl/x509_vfy.h>
#include <unistd.h>

#include <cerrno>

#include "platform/log.h"
#include "platform/shortage.h"

namespace veltrad::http {

namespace {

// Empties the queue. OpenSSL files what the system said under the number that errno had.
bool shortageInErrorQueue() {
  bool found = false;
  while (const unsigned long error = ERR_get_error()) {
    const int reason = ERR_GET_REASON(error);
    found =
        found || (ERR_SYSTEM_ERROR(error) ? platform::isShortage(reason) : reason == ERR_R_MALLOC_FAILURE);
  }
  return found;
}

}  // namespace

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
  const std::optional<Stamp> now =
      stampNow();  // before the reading: a file that changes meanwhile is read again
  if (now && (!_store || !(*now == _stamp))) {
    if (Store fresh = make(now->size >= 0)) {
      _store = std::move(fresh);
      _stamp = *now;
    }
  }
  return _store.get();
}

std::optional<TrustStore::Stamp> TrustStore::stampNow() const {
  struct stat found {};
  if (_extraCertificatesPath.empty()) return Stamp{};
  if (stat(_extraCertificatesPath.c_str(), &found) == 0)
    return Stamp{found.st_dev, found.st_ino, found.st_size, found.st_mtim};
  return platform::isShortage(errno) ? std::nullopt : std::optional(Stamp{});
}

TrustStore::Store TrustStore::make(bool withExtra) const {
  ERR_clear_error();
  Store store(X509_STORE_new());
  if (!store) return store;
  // As libcurl sets them: a trusted certificate ends the chain, whoever issued it.
  X509_STORE_set_flags(store.get(), X509_V_FLAG_TRUSTED_FIRST | X509_V_FLAG_PARTIAL_CHAIN);
  X509_STORE_load_path(store.get(), X509_get_default_cert_dir());
  const char* bundle = X509_get_default_cert_file();  // not every system has one beside its directory
  if (access(bundle, R_OK) == 0) X509_STORE_load_file(store.get(), bundle);
  if (shortageInErrorQueue()) return nullptr;
  if (!withExtra || X509_STORE_load_file(store.get(), _extraCertificatesPath.c_str()) == 1) return store;
  const char* reason = ERR_reason_error_string(ERR_peek_last_error());
  if (shortageInErrorQueue()) return nullptr;
  logWarning("Extra certificates in %s cannot be used (%s): expected PEM certificates",
             _extraCertificatesPath.c_str(), reason != nullptr ? reason : "unreadable");
  return store;
}

}  // namespace veltrad::http
