// SPDX-License-Identifier: Apache-2.0
// The service manager, if there is one: readiness, status, watchdog, socket activation.
#pragma once

#include <chrono>
#include <optional>
#include <string>

#include "base/result.h"

namespace veltrad::platform {

// Descriptors, distinguished by their paths: one that ends in "control.sock" is the control socket. A
// descriptor that was not passed is absent.
struct HandedOver {
  std::optional<int> service;
  std::optional<int> control;
};

class ServiceManager {
 public:
  // Without NOTIFY_SOCKET in the environment, notifications do nothing.
  void ready();
  void stopping();
  void status(const std::string& text);
  void feedWatchdog();
  // Half of WATCHDOG_USEC; absent if this process has no watchdog.
  std::optional<std::chrono::milliseconds> watchdogInterval() const;
  // The listening Unix stream sockets that were handed over (socket activation), made close-on-exec. A second
  // one of the same name, or one of another kind, is an error that says what came.
  Result<HandedOver, std::string> handedOverSockets();
};

}  // namespace veltrad::platform
