// SPDX-License-Identifier: Apache-2.0
// A timer of the shared pool. Its owner's lock guards it; handlers run on the pool's threads.
#pragma once

#include <chrono>
#include <functional>
#include <memory>

namespace veltrad::backends {

class WorkPool;

// The handler keeps what it needs alive. It is released when the timer is armed again or destroyed; if it was
// due already, it may still run, so it checks the time itself.
class PoolTimer {
 public:
  // Null if the pool cannot be started.
  static std::unique_ptr<PoolTimer> make(WorkPool& pool);
  ~PoolTimer();

  // Does not call `handler` directly.
  void arm(std::chrono::steady_clock::time_point when, std::function<void()> handler);

 private:
  struct Impl;
  explicit PoolTimer(std::unique_ptr<Impl> impl);
  const std::unique_ptr<Impl> _impl;
};

}  // namespace veltrad::backends
