// SPDX-License-Identifier: Apache-2.0
// The process's shared pool of two threads for timers and sockets. Any thread.
#pragma once

#include <chrono>
#include <memory>

namespace asio {
class io_context;
}

namespace veltrad::backends {

// The threads start with the first timer. Outlives every PoolTimer and ReadSource, except those that only
// their handlers hold: discard() destroys these.
class WorkPool {
 public:
  WorkPool();
  ~WorkPool();

  // Only for PoolTimer and ReadSource. Null, after one error line, if descriptors or threads are short.
  asio::io_context* context();

  // Waits until no timer is armed and no source is watched, or until `deadline`; then ends the threads.
  void drain(std::chrono::steady_clock::time_point deadline);
  // Destroys the handlers that still wait. Called after drain(), when no other thread uses the pool.
  void discard();

 private:
  struct Impl;
  const std::unique_ptr<Impl> _impl;
};

}  // namespace veltrad::backends
