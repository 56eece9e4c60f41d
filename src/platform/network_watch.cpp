// SPDX-License-Identifier: Apache-2.0
// Reads route messages of the kernel, and compares two clocks.
#include "platform/network_watch.h"

#include <linux/netlink.h>
#include <linux/rtnetlink.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <ctime>

namespace veltrad::platform {

namespace {

std::chrono::nanoseconds timeOf(clockid_t clock) {
  timespec time{};
  ::clock_gettime(clock, &time);
  return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

std::chrono::nanoseconds sleptSoFar() {
  return timeOf(CLOCK_BOOTTIME) - timeOf(CLOCK_MONOTONIC);
}

}  // namespace

NetworkWatch::NetworkWatch() : _slept(sleptSoFar()) {
  open();
}

void NetworkWatch::open() {
  _routes.reset(::socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC | SOCK_NONBLOCK, NETLINK_ROUTE));
  sockaddr_nl address{};
  address.nl_family = AF_NETLINK;
  address.nl_groups = RTMGRP_IPV4_ROUTE | RTMGRP_IPV6_ROUTE;
  if (_routes.isOpen() &&
      ::bind(_routes.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0)
    _routes.reset();
}

bool NetworkWatch::happened() {
  const auto slept = sleptSoFar();
  const bool woke = slept - _slept > std::chrono::seconds(1);
  _slept = slept;
  if (!_routes.isOpen()) open();
  return routeCame() || woke;
}

// Reads all waiting messages. If the kernel has dropped messages, a route may be among them.
bool NetworkWatch::routeCame() {
  bool came = false;
  alignas(nlmsghdr) char messages[8192];
  for (;;) {
    const ssize_t size = _routes.isOpen() ? ::recv(_routes.get(), messages, sizeof messages, 0) : -1;
    if (size < 0 && _routes.isOpen() && errno == EINTR) continue;
    if (size < 0 && _routes.isOpen() && errno == ENOBUFS) {
      came = true;
      continue;
    }
    if (size <= 0) return came;
    came = tellsOfRoute(messages, static_cast<std::size_t>(size)) || came;
  }
}

bool tellsOfRoute(const char* messages, std::size_t size) {
  nlmsghdr header{};
  for (std::size_t at = 0; size - at >= sizeof header;) {
    std::memcpy(&header, messages + at, sizeof header);
    if (header.nlmsg_len < sizeof header || header.nlmsg_len > size - at) return false;
    if (header.nlmsg_type == RTM_NEWROUTE) return true;
    const std::size_t length = NLMSG_ALIGN(header.nlmsg_len);
    if (length > size - at) return false;
    at += length;
  }
  return false;
}

}  // namespace veltrad::platform
