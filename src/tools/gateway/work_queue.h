// SPDX-License-Identifier: Apache-2.0
// Runs long tasks on a separate thread, so that they do not delay the serving thread.
#pragma once

#include <deque>
#include <functional>

#include "base/mutex.h"
#include "base/thread.h"

namespace veltrad::gateway {

// Runs tasks one after the other, in order. The callers limit the number of waiting tasks.
class WorkQueue {
 public:
  using Work = std::function<void()>;

  ~WorkQueue() { end(); }

  // False: a thread cannot be started.
  bool start();
  // Any thread, between start() and end().
  void add(Work work);
  // Runs what waits, and returns.
  void end();

 private:
  void run();

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::deque<Work> _waiting GUARDED_BY(_mutex);
  bool _ending GUARDED_BY(_mutex) = false;
  Thread _thread;
};

}  // namespace veltrad::gateway
