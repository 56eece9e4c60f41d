// The sockets of libcurl's connections.
#include "http/kept_connections.h"

#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <new>

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
}  // namespace

curl_socket_t KeptConnections::open(const curl_sockaddr& address) {
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

int KeptConnections::close(void* self, curl_socket_t socket) {
  auto& sockets = static_cast<KeptConnections*>(self)->_sockets;
  sockets.erase(std::remove(sockets.begin(), sockets.end(), socket), sockets.end());
  return ::close(socket);
}

bool KeptConnections::ended(int localPort) const {
  // Connections to different servers may share a local port; in doubt a new one is made.
  return std::any_of(_sockets.begin(), _sockets.end(), [localPort](curl_socket_t socket) {
    return localPortOf(socket) == localPort && somethingWaits(socket);
  });
}

}  // namespace veltrad::http
