// The service manager, if there is one: readiness, status, watchdog, socket activation.
#pragma once

#include <chrono>
#include <optional>
#include <string>

#include "base/result.h"

namespace veltrad::platform {

class ServiceManager {
 public:
  // Without NOTIFY_SOCKET in the environment, notifications do nothing.
  void ready();
  void stopping();
  void status(const std::string& text);
  void feedWatchdog();
  // Half of WATCHDOG_USEC; absent if this process has no watchdog.
  std::optional<std::chrono::milliseconds> watchdogInterval() const;
  // The socket of socket activation, made close-on-exec; absent if there is none. More than one, or one that
  // is not a listening Unix stream socket, is an error.
  Result<std::optional<int>, std::string> handedOverSocket();
};

}  // namespace veltrad::platform
