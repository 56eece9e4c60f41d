// Whom HTTPS connections trust: the system's certificate authorities and the extra ones of a PEM file. HTTP
// thread.
#pragma once

#include <sys/stat.h>

#include <memory>
#include <optional>
#include <string>

// OpenSSL's own names, so that its headers stay in the body.
using X509_STORE = struct x509_store_st;

namespace veltrad::http {

// One store serves every connection: the system's directory is looked into by need, so making a connection
// loads nothing. The extra file is read again when its stamp has changed. A store that lacks something for a
// shortage is never used: the last whole one serves, and the next question tries again. One thread only.
class TrustStore {
 public:
  // PEM; empty or no such file: the system's authorities alone.
  explicit TrustStore(std::string extraCertificatesPath);
  ~TrustStore();

  // Null when there is none for now: no memory, or a file that could not be read for a shortage. Lives until
  // the next call.
  X509_STORE* current();

 private:
  struct Stamp {
    dev_t device = 0;
    ino_t file = 0;
    off_t size = -1;
    timespec modified{};
    bool operator==(const Stamp& other) const;
  };
  struct Free {
    void operator()(X509_STORE* store) const;
  };
  using Store = std::unique_ptr<X509_STORE, Free>;

  // Nothing: it cannot be looked at just now.
  std::optional<Stamp> stampNow() const;
  // Null: for now it cannot be had whole.
  Store make(bool withExtra) const;

  const std::string _extraCertificatesPath;
  Store _store;
  Stamp _stamp;
};

}  // namespace veltrad::http
