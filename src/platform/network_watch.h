// SPDX-License-Identifier: Apache-2.0
// Detects that the network may be available again: a new route, or a resume of the machine. One thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>

#include "base/file_descriptor.h"

namespace veltrad::platform {

class NetworkWatch {
 public:
  // While there is no netlink socket, only waking is noticed.
  NetworkWatch();

  // To be polled for reading; negative: there is none.
  int descriptor() const { return _routes.get(); }
  // Whether a route has come, or the machine has slept, since the last call. Never blocks.
  bool happened();

 private:
  void open();
  bool routeCame();

  FileDescriptor _routes;
  // The time that the machine has slept: the difference of the clock that includes sleep and the one that
  // does not.
  std::chrono::nanoseconds _slept;
};

// Whether netlink messages announce a new route.
bool tellsOfRoute(const char* messages, std::size_t size);

}  // namespace veltrad::platform
