// The open TLS connections, and how to end one of them or all. Any thread.
#pragma once

#include <openssl/ssl.h>

#include <set>

#include "base/mutex.h"

namespace veltrad::lab {

// The HTTP library keeps its sockets to itself, and waits for idle connections when it stops; so they are
// learned from OpenSSL: the start of a handshake and the end of an SSL object. Must outlive the context that
// it watches.
class Connections {
 public:
  void watch(SSL_CTX& context);
  // Ends the connection: no byte more goes out.
  static void cut(const SSL* connection);
  // Ends every connection, those that come later included.
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
