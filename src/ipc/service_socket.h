// SPDX-License-Identifier: Apache-2.0
// The daemon's listening sockets, and the lock that ensures that there is only one daemon. Made and used by
// one thread at a time.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

#include "base/file_descriptor.h"
#include "base/result.h"
#include "platform/root.h"

namespace veltrad::ipc {

// A listening Unix stream socket. Holds the lock that it was given as long as it exists.
class ServiceSocket {
 public:
  // The socket's file if this process made it, to recognise it later.
  struct Made {
    std::string path;
    dev_t device = 0;
    ino_t file = 0;
  };
  // `made` is absent for a socket that was handed over.
  ServiceSocket(FileDescriptor listening, FileDescriptor lock, std::optional<Made> made)
      : _listening(std::move(listening)), _lock(std::move(lock)), _made(std::move(made)) {}
  ServiceSocket(ServiceSocket&&) = default;
  ~ServiceSocket() { close(); }

  int listening() const { return _listening.get(); }
  // Stops listening, and removes the socket's file if this process made it and it was not replaced. Keeps the
  // lock. May be called again.
  void close();

 private:
  FileDescriptor _listening;
  FileDescriptor _lock;
  std::optional<Made> _made;
};

// Takes the lock, then uses `handedOver` (socket activation), or replaces a stale socket file and makes
// run/veltrad/com.florn.veltrad.sock: mode 0666, close-on-exec, non-blocking, with a backlog of 1,024. The
// run directory must exist. The error is one line that says what is wrong and what to do.
Result<ServiceSocket, std::string> openServiceSocket(const platform::Root& root,
                                                     std::optional<int> handedOver);

// The same for run/veltrad/control.sock, whose process holds the lock already.
Result<ServiceSocket, std::string> openControlSocket(const platform::Root& root,
                                                     std::optional<int> handedOver);

}  // namespace veltrad::ipc
