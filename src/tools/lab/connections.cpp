// SPDX-License-Identifier: Apache-2.0
// Finds the open TLS connections with callbacks of OpenSSL.
#include "connections.h"

#include <sys/socket.h>

namespace veltrad::lab {
namespace {

int contextIndex() {
  static const int index = SSL_CTX_get_ex_new_index(0, nullptr, nullptr, nullptr, nullptr);
  return index;
}

}  // namespace

void Connections::watch(SSL_CTX& context) {
  static const int sslIndex = SSL_get_ex_new_index(0, nullptr, nullptr, nullptr, &Connections::ends);
  static_cast<void>(sslIndex);
  SSL_CTX_set_ex_data(&context, contextIndex(), this);
  SSL_CTX_set_info_callback(&context, &Connections::handshakeStarts);
}

void Connections::handshakeStarts(const SSL* ssl, int where, int /*ret*/) {
  if ((where & SSL_CB_HANDSHAKE_START) == 0) return;
  static_cast<Connections*>(SSL_CTX_get_ex_data(SSL_get_SSL_CTX(ssl), contextIndex()))->add(SSL_get_fd(ssl));
}

void Connections::ends(void* parent, void*, CRYPTO_EX_DATA*, int, long, void*) {
  const auto* ssl = static_cast<const SSL*>(parent);
  auto* self = static_cast<Connections*>(SSL_CTX_get_ex_data(SSL_get_SSL_CTX(ssl), contextIndex()));
  if (self) self->remove(SSL_get_fd(ssl));
}

void Connections::add(int socket) {
  const Lock hold(_mutex);
  _sockets.insert(socket);
  if (_stopped) ::shutdown(socket, SHUT_RDWR);
}

void Connections::remove(int socket) {
  const Lock hold(_mutex);
  _sockets.erase(socket);
}

void Connections::cut(const SSL* connection) {
  ::shutdown(SSL_get_fd(connection), SHUT_RDWR);
}

void Connections::stop() {
  const Lock hold(_mutex);
  _stopped = true;
  for (const int socket : _sockets) ::shutdown(socket, SHUT_RDWR);
}

}  // namespace veltrad::lab
