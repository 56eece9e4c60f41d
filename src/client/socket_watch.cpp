// SPDX-License-Identifier: Apache-2.0
// An epoll set of a socket and an eventfd.
#include "client/socket_watch.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>

namespace veltrad::client {

namespace {
constexpr std::uint64_t kWakeUp = 0;
constexpr std::uint64_t kSocket = 1;

bool control(int epoll, int operation, int descriptor, std::uint32_t events, std::uint64_t what) {
  epoll_event event{};
  event.events = events;
  event.data.u64 = what;
  return ::epoll_ctl(epoll, operation, descriptor, &event) == 0;
}
}  // namespace

SocketWatch::SocketWatch()
    : _epoll(::epoll_create1(EPOLL_CLOEXEC)), _wakeUp(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  _usable = _epoll.isOpen() && _wakeUp.isOpen() &&
            control(_epoll.get(), EPOLL_CTL_ADD, _wakeUp.get(), EPOLLIN, kWakeUp);
}

void SocketWatch::watch(int socket, std::uint32_t events) {
  if (!control(_epoll.get(), EPOLL_CTL_ADD, socket, events, kSocket)) return;
  _socket = socket;
  _events = events;
}

void SocketWatch::setEvents(std::uint32_t events) {
  if (_socket < 0 || events == _events) return;
  if (control(_epoll.get(), EPOLL_CTL_MOD, _socket, events, kSocket)) _events = events;
}

void SocketWatch::forget() {
  if (_socket >= 0) ::epoll_ctl(_epoll.get(), EPOLL_CTL_DEL, _socket, nullptr);
  _socket = -1;
}

void SocketWatch::abandon() {
  _epoll.reset();
  _wakeUp.reset();
  _socket = -1;
}

void SocketWatch::wake() {
  ::eventfd_write(_wakeUp.get(), 1);
}

std::uint32_t SocketWatch::wait(int milliseconds) {
  epoll_event events[2];
  const int count = ::epoll_wait(_epoll.get(), events, 2, milliseconds);
  std::uint32_t onSocket = 0;
  for (int i = 0; i < count; ++i) {
    if (events[i].data.u64 == kSocket) {
      onSocket = events[i].events;
    } else {
      eventfd_t wakes;
      ::eventfd_read(_wakeUp.get(), &wakes);
    }
  }
  return onSocket;
}

}  // namespace veltrad::client
