// SPDX-License-Identifier: Apache-2.0
// Waits for events of a connection's socket, and for other threads that wake the waiting thread.
#pragma once

#include <cstdint>
#include <optional>

#include "base/file_descriptor.h"

namespace veltrad::client {

// One thread waits. Any thread may call wake(); all other functions are used under the connection's lock.
class SocketWatch {
 public:
  SocketWatch();
  // False if the process had no descriptors; errno says why.
  bool usable() const { return _usable; }

  // Begins to watch a connection's socket. Errors of the socket are always reported.
  void watch(int socket, std::uint32_t events);
  void setEvents(std::uint32_t events);
  // To be called before the socket is closed, and when the daemon has hung up, which would be reported again
  // and again.
  void forget();
  void wake();
  // In a forked child: closes its copies of the descriptors.
  void abandon();

  // Waits for `milliseconds`, or without a bound if negative. Returns what happened to the socket, as epoll
  // says it; 0 for anything else.
  std::uint32_t wait(int milliseconds);

 private:
  FileDescriptor _epoll;
  FileDescriptor _wakeUp;
  bool _usable;
  // -1 if none is watched.
  int _socket = -1;
  std::uint32_t _events = 0;
};

}  // namespace veltrad::client
