// SPDX-License-Identifier: Apache-2.0
// The sockets of libcurl's connections, and the certificates that they trust.
#include "http/connections.h"

#include <dirent.h>
#include <netinet/in.h>
#include <openssl/err.h>
#include <openssl/x509.h>
#include <openssl/x509_vfy.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <new>
#include <string_view>
#include <utility>

#include "platform/log.h"
#include "platform/shortage.h"

namespace veltrad::http {

namespace {

int localPortOf(curl_socket_t socket) {
  sockaddr_storage address{};
  socklen_t length = sizeof address;
  if (getsockname(socket, reinterpret_cast<sockaddr*>(&address), &length) != 0) return -1;
  if (address.ss_family == AF_INET) return ntohs(reinterpret_cast<const sockaddr_in&>(address).sin_port);
  if (address.ss_family == AF_INET6) return ntohs(reinterpret_cast<const sockaddr_in6&>(address).sin6_port);
  return -1;
}

bool somethingWaits(curl_socket_t socket) {
  char byte = 0;
  const ssize_t length = recv(socket, &byte, 1, MSG_PEEK | MSG_DONTWAIT);
  return length >= 0 || (errno != EAGAIN && errno != EWOULDBLOCK && errno != EINTR);
}

// Empties OpenSSL's error queue. The reason of a system error is the errno.
bool shortageInErrorQueue() {
  bool found = false;
  while (const unsigned long error = ERR_get_error()) {
    const int reason = ERR_GET_REASON(error);
    found =
        found || (ERR_SYSTEM_ERROR(error) ? platform::isShortage(reason) : reason == ERR_R_MALLOC_FAILURE);
  }
  return found;
}

// Whether `c_rehash` or its like has made the links by which OpenSSL finds a certificate of the directory.
bool isHashed(const char* directory) {
  const std::unique_ptr<DIR, int (*)(DIR*)> entries(opendir(directory), closedir);
  while (const dirent* entry = entries ? readdir(entries.get()) : nullptr) {
    const std::string_view name = entry->d_name;
    if (name.size() > 9 && name[8] == '.' && name.find_first_not_of("0123456789abcdef") == 8) return true;
  }
  return false;
}

}  // namespace

void Connections::Free::operator()(X509_STORE* store) const {
  X509_STORE_free(store);
}

Connections::Connections(std::string extraCertificatesPath)
    : _extraCertificatesPath(std::move(extraCertificatesPath)) {}

curl_socket_t Connections::open(const curl_sockaddr& address) {
  try {
    _sockets.reserve(_sockets.size() + 1);
  } catch (const std::bad_alloc&) {
    errno = ENOMEM;
    return CURL_SOCKET_BAD;
  }
  const curl_socket_t made = socket(address.family, address.socktype | SOCK_CLOEXEC, address.protocol);
  if (made != CURL_SOCKET_BAD) _sockets.push_back(made);
  return made;
}

int Connections::close(void* self, curl_socket_t socket) {
  auto& sockets = static_cast<Connections*>(self)->_sockets;
  sockets.erase(std::remove(sockets.begin(), sockets.end(), socket), sockets.end());
  return ::close(socket);
}

bool Connections::ended(int localPort) const {
  // Connections to different servers may share a local port. This may then report a live connection as ended,
  // which only costs a new one.
  return std::any_of(_sockets.begin(), _sockets.end(), [localPort](curl_socket_t socket) {
    return localPortOf(socket) == localPort && somethingWaits(socket);
  });
}

X509_STORE* Connections::trusted() {
  // First, so that a file that changes meanwhile is read again. Fails only during a shortage.
  const auto now = platform::DiskFileStore().stamp(_extraCertificatesPath);
  if (now && (!_store || now.value() != _stamp)) {
    if (Store fresh = makeStore(now.value().has_value())) {
      _store = std::move(fresh);
      _stamp = now.value();
    }
  }
  return _store.get();
}

Connections::Store Connections::makeStore(bool withExtra) const {
  ERR_clear_error();
  Store store(X509_STORE_new());
  if (!store) return store;
  // The same flags as libcurl sets: a trusted certificate ends the chain, whoever issued it.
  X509_STORE_set_flags(store.get(), X509_V_FLAG_TRUSTED_FIRST | X509_V_FLAG_PARTIAL_CHAIN);
  // A hashed directory is read one certificate at a time, as handshakes ask; a bundle costs more than a MiB
  // at once.
  const char* directory = X509_get_default_cert_dir();
  const char* bundle = X509_get_default_cert_file();  // does not exist on every system
  X509_STORE_load_path(store.get(), directory);
  if (!isHashed(directory) && access(bundle, R_OK) == 0) X509_STORE_load_file(store.get(), bundle);
  if (shortageInErrorQueue()) return nullptr;
  if (!withExtra || X509_STORE_load_file(store.get(), _extraCertificatesPath.c_str()) == 1) return store;
  const char* reason = ERR_reason_error_string(ERR_peek_last_error());
  if (shortageInErrorQueue()) return nullptr;
  logWarning("Extra certificates in %s cannot be used (%s): expected PEM certificates",
             _extraCertificatesPath.c_str(), reason != nullptr ? reason : "unreadable");
  return store;
}

}  // namespace veltrad::http
