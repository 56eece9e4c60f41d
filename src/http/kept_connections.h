// The sockets of libcurl's connections, to see whether a kept one has ended. HTTP thread.
#pragma once

#include <curl/curl.h>

#include <vector>

namespace veltrad::http {

// libcurl takes a TLS connection that its server has closed for a live one: the closing alert is waiting data
// to it. Used for a post, that post would be lost.
class KeptConnections {
 public:
  KeptConnections() = default;
  KeptConnections(const KeptConnections&) = delete;
  KeptConnections& operator=(const KeptConnections&) = delete;

  // Close-on-exec; CURL_SOCKET_BAD with errno.
  curl_socket_t open(const curl_sockaddr& address);
  // For CURLOPT_CLOSESOCKETFUNCTION; `self` is a KeptConnections, which must outlive the connections.
  static int close(void* self, curl_socket_t socket);

  // Whether something waits to be read, the end included, on the connection from this local port. Before a
  // request is sent nothing that its server says there can be an answer.
  bool ended(int localPort) const;

 private:
  std::vector<curl_socket_t> _sockets;
};

}  // namespace veltrad::http
