// One timer of the shared pool. Its owner's lock guards it; handlers run on the pool's threads.
#pragma once

#include <chrono>
#include <functional>
#include <memory>

namespace veltrad::backends {

class WorkPool;

// The handler keeps what it needs alive; it is let go when the timer is cancelled or armed anew. One that was
// due already may still run then: it looks at the clock itself.
class PoolTimer {
 public:
  // Null where the pool cannot be started.
  static std::unique_ptr<PoolTimer> make(WorkPool& pool);
  ~PoolTimer();
  PoolTimer(const PoolTimer&) = delete;
  PoolTimer& operator=(const PoolTimer&) = delete;

  // Never calls `handler` itself.
  void arm(std::chrono::steady_clock::time_point when, std::function<void()> handler);
  void cancel();

 private:
  struct Impl;
  explicit PoolTimer(std::unique_ptr<Impl> impl);
  const std::unique_ptr<Impl> _impl;
};

}  // namespace veltrad::backends
