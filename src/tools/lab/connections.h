// SPDX-License-Identifier: Apache-2.0
// Ends one or all of the open TLS connections. Any thread.
#pragma once

#include <openssl/ssl.h>

#include <set>

#include "base/mutex.h"

namespace veltrad::lab {

// The HTTP library does not tell its sockets, and waits for idle connections when it stops. So the sockets
// are found through OpenSSL, at the start of a handshake and at the end of an SSL object. Must outlive the
// context.
class Connections {
 public:
  void watch(SSL_CTX& context);
  // Ends a connection; nothing more is sent.
  static void cut(const SSL* connection);
  // Ends every connection, also those that come later.
  void stop();

 private:
  static void handshakeStarts(const SSL* ssl, int where, int ret);
  static void ends(void* parent, void* self, CRYPTO_EX_DATA* data, int index, long argument, void* pointer);
  void add(int socket);
  void remove(int socket);

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::set<int> _sockets GUARDED_BY(_mutex);
  bool _stopped GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::lab
