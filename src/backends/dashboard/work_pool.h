// The process's shared pool: two threads for timers and sockets that nobody waits at. Any thread.
#pragma once

#include <chrono>
#include <memory>

namespace asio {
class io_context;
}

namespace veltrad::backends {

// The threads start with the first timer. It outlives every PoolTimer and ReadSource, but for those that only
// their own handlers keep: discard() destroys them with it.
class WorkPool {
 public:
  WorkPool();
  ~WorkPool();
  WorkPool(const WorkPool&) = delete;
  WorkPool& operator=(const WorkPool&) = delete;

  // For PoolTimer and ReadSource alone. Null: descriptors or threads are short; one error line has said so.
  asio::io_context* context();

  // Waits until no timer is armed and no source is watched, at most until `deadline`; then the threads end.
  void drain(std::chrono::steady_clock::time_point deadline);
  // After drain(), when no other thread uses the pool any more: destroys the handlers that still wait.
  void discard();

 private:
  struct Impl;
  const std::unique_ptr<Impl> _impl;
};

}  // namespace veltrad::backends
