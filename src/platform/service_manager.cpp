// SPDX-License-Identifier: Apache-2.0
// Notifications and socket activation with libsystemd.
#include "platform/service_manager.h"

#include <fmt/format.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>

#include <algorithm>
#include <cstddef>
#include <system_error>

namespace veltrad::platform {

namespace {

// The path of a Unix socket, or the name of an abstract one.
std::string nameOf(int socket) {
  sockaddr_un address{};
  socklen_t size = sizeof address;
  if (::getsockname(socket, reinterpret_cast<sockaddr*>(&address), &size) != 0) return {};
  const std::size_t begin = offsetof(sockaddr_un, sun_path);
  std::string name(address.sun_path, size > begin ? size - begin : 0);
  while (!name.empty() && name.back() == '\0') name.pop_back();
  return name;
}

}  // namespace

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

Result<HandedOver, std::string> ServiceManager::handedOverSockets() {
  const int count = ::sd_listen_fds(1);  // takes the variables out of the environment; close-on-exec
  if (count < 0) return Failure{"the handed-over sockets: " + std::generic_category().message(-count)};
  HandedOver sockets;
  for (int socket = SD_LISTEN_FDS_START; socket < SD_LISTEN_FDS_START + count; ++socket) {
    if (::sd_is_socket(socket, AF_UNIX, SOCK_STREAM, 1) <= 0) {
      return Failure{fmt::format("the handed-over descriptor {} is no listening Unix stream socket", socket)};
    }
    const bool control = nameOf(socket).ends_with("control.sock");
    std::optional<int>& place = control ? sockets.control : sockets.service;
    if (place) {
      return Failure{fmt::format("expected one handed-over {} socket, got another one with descriptor {}",
                                 control ? "control" : "service", socket)};
    }
    place = socket;
  }
  return sockets;
}

}  // namespace veltrad::platform
