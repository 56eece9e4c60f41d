// SPDX-License-Identifier: Apache-2.0
// Takes the lock, removes a stale socket and makes the listening one.
#include "ipc/service_socket.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cerrno>
#include <cstring>

#include "platform/daemon_lock.h"

namespace veltrad::ipc {

namespace {

constexpr int kWaitingConnections = 1024;

std::string reason(int error) {
  return std::strerror(error);
}

Result<FileDescriptor, std::string> takeLock(const std::string& path) {
  auto lock = platform::takeDaemonLock(path);
  if (lock) return std::move(lock.value());
  const platform::LockRefusal& refusal = lock.error();
  if (!refusal.held) return Failure{fmt::format("The lock cannot be taken: {}.", refusal.description)};
  return Failure{fmt::format(
      "The daemon is already running: {}. Stop it first, or give this one a root of its own in VELTRA_ROOT.",
      refusal.description)};
}

// Absent if nothing is at the path now. Only the holder of the lock may call it.
std::optional<std::string> removeStale(const std::string& path) {
  struct stat found {};
  if (::lstat(path.c_str(), &found) != 0) {
    if (errno == ENOENT) return std::nullopt;
    return fmt::format("{} cannot be looked at: {}.", path, reason(errno));
  }
  if (!S_ISSOCK(found.st_mode)) {
    return fmt::format("{} is no socket, but the daemon's socket belongs there: remove it.", path);
  }
  if (::unlink(path.c_str()) != 0 && errno != ENOENT) {
    return fmt::format("The stale socket {} cannot be removed: {}.", path, reason(errno));
  }
  return std::nullopt;
}

// `made` gets the status of the file; fstat on the socket would show an inode of another file system.
Result<FileDescriptor, std::string> listenAt(const std::string& path, struct stat& made) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) {
    return Failure{fmt::format(
        "The socket's path {} has {} bytes, and a socket address holds {}: choose a shorter root.", path,
        path.size(), sizeof address.sun_path - 1)};
  }
  std::memcpy(address.sun_path, path.data(), path.size());
  if (auto fault = removeStale(path)) return Failure{std::move(*fault)};
  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!socket.isOpen()) return Failure{fmt::format("No socket could be made: {}.", reason(errno))};
  if (::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    return Failure{fmt::format("The socket {} cannot be made: {}.", path, reason(errno))};
  }
  // Access is decided by the entitlement, not by the file's mode.
  if (::lstat(path.c_str(), &made) != 0 || ::chmod(path.c_str(), 0666) != 0 ||
      ::listen(socket.get(), kWaitingConnections) != 0) {
    const int error = errno;
    ::unlink(path.c_str());
    return Failure{fmt::format("The socket {} cannot be opened to clients: {}.", path, reason(error))};
  }
  return socket;
}

// `handedOver` as it is, else one that is made at `path`.
Result<ServiceSocket, std::string> openAt(const std::string& path, std::optional<int> handedOver,
                                          FileDescriptor lock) {
  if (handedOver) return ServiceSocket(FileDescriptor(*handedOver), std::move(lock), std::nullopt);
  struct stat made {};
  auto socket = listenAt(path, made);
  if (!socket) return Failure{socket.error()};
  return ServiceSocket(std::move(socket.value()), std::move(lock),
                       ServiceSocket::Made{path, made.st_dev, made.st_ino});
}

}  // namespace

void ServiceSocket::close() {
  if (!_listening.isOpen()) return;
  struct stat found {};
  if (_made && ::lstat(_made->path.c_str(), &found) == 0 && found.st_dev == _made->device &&
      found.st_ino == _made->file) {
    ::unlink(_made->path.c_str());
  }
  _listening.reset();
}

Result<ServiceSocket, std::string> openServiceSocket(const platform::Root& root,
                                                     std::optional<int> handedOver) {
  auto lock = takeLock(root.lockPath());
  if (!lock) return Failure{lock.error()};
  return openAt(root.socketPath(), handedOver, std::move(lock.value()));
}

Result<ServiceSocket, std::string> openControlSocket(const platform::Root& root,
                                                     std::optional<int> handedOver) {
  return openAt(root.controlSocketPath(), handedOver, {});
}

}  // namespace veltrad::ipc
