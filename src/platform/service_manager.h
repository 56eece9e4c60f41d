// The service manager, where there is one: readiness, status, watchdog, handed-over sockets. Any thread.
#pragma once

#include <chrono>
#include <optional>
#include <string>

#include "base/result.h"

namespace veltrad::platform {

class ServiceManager {
 public:
  // Without NOTIFY_SOCKET in the environment every notification does nothing.
  void ready();
  void stopping();
  void status(const std::string& text);
  void feedWatchdog();
  // Half of WATCHDOG_USEC; absent when no watchdog is wanted of this process.
  std::optional<std::chrono::milliseconds> watchdogInterval() const;
  // The one listening Unix stream socket that was handed over (socket activation), made close-on-exec, or
  // nothing. More than one, or one of another kind, is an error that says what came.
  Result<std::optional<int>, std::string> handedOverSocket();
};

}  // namespace veltrad::platform
