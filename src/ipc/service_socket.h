// The sockets on which the daemon is reached, and the lock that says which process is the daemon. Made and
// used by one thread at a time.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

#include "base/file_descriptor.h"
#include "base/result.h"
#include "platform/root.h"

namespace veltrad::ipc {

// A listening Unix stream socket. With a lock, run/veltrad/lock is held as long as the object lives.
class ServiceSocket {
 public:
  // The socket's file, where this process made it: as it was then.
  struct Made {
    std::string path;
    dev_t device = 0;
    ino_t file = 0;
  };
  // Without `made`: a socket that was handed over.
  ServiceSocket(FileDescriptor listening, FileDescriptor lock, std::optional<Made> made)
      : _listening(std::move(listening)), _lock(std::move(lock)), _made(std::move(made)) {}
  ServiceSocket(ServiceSocket&&) = default;
  ServiceSocket& operator=(ServiceSocket&&) = delete;
  ~ServiceSocket() { close(); }

  int listening() const { return _listening.get(); }
  // Stops listening and removes the socket's file if this process made it and nothing else has taken its
  // place; keeps the lock. Twice does nothing.
  void close();

 private:
  FileDescriptor _listening;
  FileDescriptor _lock;
  std::optional<Made> _made;
};

// Takes the lock, then uses `handedOver` (socket activation) as it is, or removes a stale socket file and
// makes run/veltrad/com.florn.veltrad.sock: mode 0666, close-on-exec, non-blocking, 1,024 connections waiting
// at most. The run directory must be there. The error is one line that names what is in the way and what to
// do.
Result<ServiceSocket, std::string> openServiceSocket(const platform::Root& root,
                                                     std::optional<int> handedOver);

// The same for run/veltrad/control.sock, whose process holds the lock already.
Result<ServiceSocket, std::string> openControlSocket(const platform::Root& root,
                                                     std::optional<int> handedOver);

}  // namespace veltrad::ipc
