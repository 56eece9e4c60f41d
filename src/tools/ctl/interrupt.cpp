// SPDX-License-Identifier: Apache-2.0
// Waits for a descriptor and for signals.
#include "tools/ctl/interrupt.h"

#include <poll.h>
#include <pthread.h>
#include <signal.h>
#include <sys/signalfd.h>

#include <algorithm>
#include <climits>

namespace veltrad::ctl {
namespace {

sigset_t endingSignals() {
  sigset_t set;
  sigemptyset(&set);
  sigaddset(&set, SIGINT);
  sigaddset(&set, SIGTERM);
  return set;
}

}  // namespace

void Interrupt::begin() {
  const sigset_t set = endingSignals();
  _signals = FileDescriptor(signalfd(-1, &set, SFD_CLOEXEC | SFD_NONBLOCK));
  // Without the descriptor the signals keep ending the process.
  if (_signals.get() >= 0) pthread_sigmask(SIG_BLOCK, &set, nullptr);
}

Interrupt::Wake Interrupt::wait(int descriptor, std::optional<std::chrono::milliseconds> time) {
  using Clock = std::chrono::steady_clock;
  const auto deadline = Clock::now() + time.value_or(std::chrono::milliseconds(0));
  pollfd polled[2] = {{_signals.get(), POLLIN, 0}, {descriptor, POLLIN, 0}};
  while (!_interrupted) {
    int left = -1;
    if (time) {
      const auto ms = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now()).count();
      left = static_cast<int>(std::clamp<long long>(ms, 0, INT_MAX));
    }
    const int count = poll(polled, 2, left);
    if (count == 0 && left >= 0) return Wake::timeout;
    if (count <= 0) continue;  // EINTR
    signalfd_siginfo info;
    if (polled[0].revents && read(_signals.get(), &info, sizeof info) == static_cast<ssize_t>(sizeof info)) {
      _interrupted = true;
      const sigset_t set = endingSignals();
      pthread_sigmask(SIG_UNBLOCK, &set, nullptr);
    } else if (polled[1].revents) {
      return Wake::ready;
    }
  }
  return Wake::interrupted;
}

}  // namespace veltrad::ctl
