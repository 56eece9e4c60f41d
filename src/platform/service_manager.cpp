// Notifications and socket activation with libsystemd.
#include "platform/service_manager.h"

#include <sys/socket.h>
#include <systemd/sd-daemon.h>

#include <algorithm>
#include <system_error>

namespace veltrad::platform {

void ServiceManager::ready() {
  ::sd_notify(0, "READY=1");
}

void ServiceManager::stopping() {
  ::sd_notify(0, "STOPPING=1");
}

void ServiceManager::status(const std::string& text) {
  std::string assignment = "STATUS=" + text;
  // A line break would begin another assignment.
  std::replace(assignment.begin(), assignment.end(), '\n', ' ');
  ::sd_notify(0, assignment.c_str());
}

void ServiceManager::feedWatchdog() {
  ::sd_notify(0, "WATCHDOG=1");
}

std::optional<std::chrono::milliseconds> ServiceManager::watchdogInterval() const {
  std::uint64_t microseconds = 0;
  if (::sd_watchdog_enabled(0, &microseconds) <= 0) return std::nullopt;
  return std::max(std::chrono::milliseconds(microseconds / 2'000), std::chrono::milliseconds(1));
}

Result<std::optional<int>, std::string> ServiceManager::handedOverSocket() {
  const int count = ::sd_listen_fds(1);  // removes the variables from the environment; close-on-exec
  if (count < 0) return Failure{"the handed-over sockets: " + std::generic_category().message(-count)};
  if (count == 0) return std::optional<int>();
  if (count > 1) return Failure{"expected one handed-over socket, got " + std::to_string(count)};
  const int socket = SD_LISTEN_FDS_START;
  if (::sd_is_socket(socket, AF_UNIX, SOCK_STREAM, 1) <= 0) {
    return Failure{std::string("the handed-over descriptor is no listening Unix stream socket")};
  }
  return std::optional(socket);
}

}  // namespace veltrad::platform
