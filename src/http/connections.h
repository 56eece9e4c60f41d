// SPDX-License-Identifier: Apache-2.0
// The sockets and the trusted certificate authorities of HTTPS connections. HTTP thread.
#pragma once

#include <curl/curl.h>

#include <memory>
#include <string>
#include <vector>

#include "platform/file_store.h"

// As in OpenSSL's headers.
using X509_STORE = struct x509_store_st;

namespace veltrad::http {

// Must outlive the connections.
//
// Trusts the system's authorities and those of an extra PEM file. All connections share one store, which
// looks into the system's directory on demand, so a new connection loads nothing. The extra file is read
// again when it has changed. A store that is incomplete because of a shortage is never used: the last
// complete one stays in use, and the next call tries again.
class Connections {
 public:
  // The path may be empty, and the file may be missing.
  explicit Connections(std::string extraCertificatesPath);
  Connections(const Connections&) = delete;

  // Close-on-exec; CURL_SOCKET_BAD with errno on failure.
  curl_socket_t open(const curl_sockaddr& address);
  // For CURLOPT_CLOSESOCKETFUNCTION; `self` is a Connections.
  static int close(void* self, curl_socket_t socket);
  // True if there is data, or the end, to be read on the connection from this local port. Before a request is
  // sent, this can only mean that the server has closed the connection. libcurl takes the alert that closes a
  // TLS connection for data and the connection for live, so a post sent on it would be lost.
  bool ended(int localPort) const;

  // Null if there is no complete store because of a shortage. Valid until the next call.
  X509_STORE* trusted();

 private:
  struct Free {
    void operator()(X509_STORE* store) const;
  };
  using Store = std::unique_ptr<X509_STORE, Free>;

  // Null if it would be incomplete because of a shortage.
  Store makeStore(bool withExtra) const;

  std::vector<curl_socket_t> _sockets;
  const std::string _extraCertificatesPath;
  Store _store;
  platform::FileStamp _stamp;  // of the extra file, when the store was made
};

}  // namespace veltrad::http
