// SPDX-License-Identifier: Apache-2.0
// Runs each task of a tick separately.
#include "daemon/housekeeping.h"

#include <algorithm>
#include <new>

#include "daemon/daemon.h"
#include "ipc/listener.h"
#include "platform/log.h"
#include "platform/scheduling.h"
#include "platform/state_file.h"

namespace veltrad::daemon {

namespace {
using namespace std::chrono_literals;

// How often the counters are written and the watchdog is fed.
constexpr std::chrono::milliseconds kTick = 1000ms;
// How often the owner's decision is read in that time. A change, and the end of running requests one reading
// later, take effect within a second.
constexpr int kOwnerTicks = 3;
// The last threads may still be ending.
constexpr int kTicksToReturnMemory = 3;
}  // namespace

Housekeeping::Housekeeping(Services& services, Daemon& daemon, ipc::Listener& listener,
                           const StateFiles& files)
    : _services(services),
      _daemon(daemon),
      _listener(listener),
      _files(files),
      _watchdog(services.serviceManager.watchdogInterval()),
      _second(std::min(_watchdog.value_or(kTick), kTick)) {}

std::chrono::milliseconds Housekeeping::interval() const {
  return _second / kOwnerTicks;
}

template <typename Step>
bool Housekeeping::attempt(const Step& step) {
  try {
    step();
    return true;
  } catch (const std::bad_alloc&) {
    _isShort = true;
    return false;
  }
}

void Housekeeping::tick() {
  _isShort = false;
  if (_readsAgain) readConfigurationAgain();
  attempt([this] { _daemon.privacy().hearOwner(); });
  attempt([this] { _services.history.writeSoon(); });
  if (++_ownerTicks >= kOwnerTicks) {
    _ownerTicks = 0;
    onceASecond();
  }
  sayShortage();
}

void Housekeeping::onceASecond() {
  attempt([this] { _daemon.follower().tick(); });
  attempt([this] { _daemon.startSpool(); });
  attempt([this] { _services.allowance.load(); });
  attempt([this] { _services.destinations.load(); });
  for (platform::StateFile* file :
       {&_files.counters, &_files.metrics, &_files.allowance, &_files.destinations})
    attempt([file] { file->writeSoon(); });
  attempt([this] { returnMemoryWhenIdle(); });
  attempt([this] {
    if (_watchdog && _services.http.passesEmptyTask(_second)) _services.serviceManager.feedWatchdog();
  });
}

void Housekeeping::returnMemoryWhenIdle() {
  // A session's memory is freed by its connection's thread, which may take its time on a busy machine.
  const bool idle = _daemon.agent().sessionCount() == 0 && _listener.connectionCount() == 0 &&
                    _services.memory.used() == 0 && _services.http.underWay() == 0;
  // Detects sessions that came and went between two ticks.
  const std::uint64_t accepted = _daemon.agent().acceptedSessions();
  if (!idle || accepted != _accepted) {
    _accepted = accepted;
    _returns = kTicksToReturnMemory;
  } else if (_returns > 0) {
    --_returns;
    _daemon.backends().rest();
    platform::returnFreeMemory();
  }
}

void Housekeeping::readConfigurationAgain() {
  _readsAgain = !attempt([this] { _daemon.readConfigurationAgain(); });
}

void Housekeeping::sayShortage() {
  if (_isShort && !_wasShort)
    logWarning("There is no memory for what is done each second, and it is tried again");
  _wasShort = _isShort;
}

}  // namespace veltrad::daemon
