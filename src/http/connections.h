// What HTTPS connections are made with: sockets that can be asked whether their server has gone, and the
// certificate authorities that are trusted. HTTP thread.
#pragma once

#include <curl/curl.h>
#include <sys/stat.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

// OpenSSL's own names, so that its headers stay in the body.
using X509_STORE = struct x509_store_st;

namespace veltrad::http {

// One thread only; outlives the connections.
//
// Trusted are the system's authorities and those of an extra PEM file. One store serves every connection: the
// system's directory is looked into by need, so making a connection loads nothing. The extra file is read
// again when its stamp has changed. A store that lacks something for a shortage is never used: the last whole
// one serves, and the next question tries again.
class Connections {
 public:
  // Empty or no such file: the system's authorities alone.
  explicit Connections(std::string extraCertificatesPath);
  ~Connections();
  Connections(const Connections&) = delete;
  Connections& operator=(const Connections&) = delete;

  // Close-on-exec; CURL_SOCKET_BAD with errno.
  curl_socket_t open(const curl_sockaddr& address);
  // For CURLOPT_CLOSESOCKETFUNCTION; `self` is a Connections.
  static int close(void* self, curl_socket_t socket);
  // Whether something waits to be read, the end included, on the connection from this local port. libcurl
  // takes a TLS connection that its server has closed for a live one, since the closing alert is waiting
  // data to it: a post sent there would be lost. Before a request is sent, nothing that its server says
  // there can be an answer.
  bool ended(int localPort) const;

  // Null when there is none for now: no memory, or a file that could not be read for a shortage. Lives until
  // the next call.
  X509_STORE* trusted();

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
  Store makeStore(bool withExtra) const;

  std::vector<curl_socket_t> _sockets;
  const std::string _extraCertificatesPath;
  Store _store;
  Stamp _stamp;
};

}  // namespace veltrad::http
