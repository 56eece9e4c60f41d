// SPDX-License-Identifier: Apache-2.0
// The main run loop, which waits on a signal descriptor.
#include "platform/run_loop.h"

#include <poll.h>
#include <signal.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <optional>

namespace veltrad::platform {

namespace {

sigset_t setOf(std::initializer_list<int> signals) {
  sigset_t set;
  ::sigemptyset(&set);
  for (const int signal : signals) ::sigaddset(&set, signal);
  return set;
}

extern "C" void endAtOnce(int) {
  ::_exit(1);
}

void letASecondSignalEndTheProcess() {
  struct sigaction action {};
  action.sa_handler = endAtOnce;
  ::sigaction(SIGTERM, &action, nullptr);
  ::sigaction(SIGINT, &action, nullptr);
  const sigset_t ending = setOf({SIGTERM, SIGINT});
  ::pthread_sigmask(SIG_UNBLOCK, &ending, nullptr);
}

struct Signals {
  std::optional<int> ending;
  bool hangUp = false;
};

// Reads the pending signals.
Signals signalsIn(int descriptor) {
  Signals come;
  signalfd_siginfo information{};
  while (!come.ending &&
         ::read(descriptor, &information, sizeof information) == static_cast<ssize_t>(sizeof information)) {
    const int signal = static_cast<int>(information.ssi_signo);
    if (signal == SIGHUP) come.hangUp = true;
    if (signal == SIGTERM || signal == SIGINT) come.ending = signal;
  }
  return come;
}

}  // namespace

void RunLoop::blockSignals() {
  ::signal(SIGPIPE, SIG_IGN);
  ::signal(SIGXFSZ, SIG_IGN);  // the write then fails
  const sigset_t set = setOf({SIGTERM, SIGINT, SIGHUP});
  ::pthread_sigmask(SIG_BLOCK, &set, nullptr);
  _signals.reset(::signalfd(-1, &set, SFD_CLOEXEC | SFD_NONBLOCK));
  if (!_signals.isOpen()) std::abort();
}

int RunLoop::run(std::chrono::milliseconds interval, const std::function<void()>& tick,
                 const std::function<void()>& hangUp) {
  using SteadyClock = std::chrono::steady_clock;
  auto next = SteadyClock::now() + interval;
  while (true) {
    pollfd waited{_signals.get(), POLLIN, 0};
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(next - SteadyClock::now()).count();
    const int ready = ::poll(&waited, 1, static_cast<int>(std::clamp<std::int64_t>(left, 0, 60'000)));
    if (ready < 0 && errno != EINTR) std::abort();
    if (ready > 0) {
      const Signals come = signalsIn(_signals.get());
      if (come.ending) {
        letASecondSignalEndTheProcess();
        return *come.ending;
      }
      if (come.hangUp) hangUp();
    }
    if (SteadyClock::now() < next) continue;
    tick();
    next = std::max(next + interval, SteadyClock::now());  // missed ticks are not repeated
  }
}

}  // namespace veltrad::platform
