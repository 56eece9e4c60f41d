// SPDX-License-Identifier: Apache-2.0
// The periodic tasks of the main thread while the daemon serves: several times a second, and once a second.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>

#include "daemon/services.h"

namespace veltrad::ipc {
class Listener;
}  // namespace veltrad::ipc

namespace veltrad::platform {
class StateFile;
}  // namespace veltrad::platform

namespace veltrad::daemon {

class Daemon;

struct StateFiles {
  platform::StateFile& counters;
  platform::StateFile& metrics;
  platform::StateFile& allowance;
  platform::StateFile& destinations;
};

// A task that fails for lack of memory does not stop the others, and is repeated at the next tick.
class Housekeeping {
 public:
  // The constructor's arguments must outlive it.
  Housekeeping(Services& services, Daemon& daemon, ipc::Listener& listener, const StateFiles& files);

  // Between two ticks.
  std::chrono::milliseconds interval() const;
  void tick();
  // After SIGHUP.
  void readConfigurationAgain();

 private:
  // False if there was no memory for it.
  template <typename Step>
  bool attempt(const Step& step);
  void onceASecond();
  void returnMemoryWhenIdle();
  void sayShortage();

  Services& _services;
  Daemon& _daemon;
  ipc::Listener& _listener;
  const StateFiles _files;
  const std::optional<std::chrono::milliseconds> _watchdog;
  const std::chrono::milliseconds _second;  // or the watchdog's interval, if that is shorter
  int _ownerTicks = 0;
  int _returns = 0;             // of memory, that are still to come
  std::uint64_t _accepted = 0;  // sessions, at the last look
  bool _readsAgain = false;     // SIGHUP came, and not everything was read
  bool _isShort = false;        // in this tick
  bool _wasShort = false;
};

}  // namespace veltrad::daemon
