// SPDX-License-Identifier: Apache-2.0
// Runs what would be a long turn of the thread that serves everybody on a thread of its own.
#pragma once

#include <deque>
#include <functional>

#include "base/mutex.h"
#include "base/thread.h"

namespace veltrad::gateway {

// One work after the other, in their order. What waits is bounded by those who hand it over.
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
