// SPDX-License-Identifier: Apache-2.0
// Waits for work.
#include "gateway/work_queue.h"

#include <utility>

namespace veltrad::gateway {

namespace {
// A body may be nested 64 levels deep.
constexpr std::size_t kWorkStackBytes = 1u << 20;
}  // namespace

bool WorkQueue::start() {
  return _thread.start("bodies", kWorkStackBytes, [this] { run(); });
}

void WorkQueue::add(Work work) {
  {
    const Lock hold(_mutex);
    _waiting.push_back(std::move(work));
  }
  _changed.notifyOne();
}

void WorkQueue::end() {
  {
    const Lock hold(_mutex);
    _ending = true;
  }
  _changed.notifyOne();
  if (_thread.running()) _thread.join();
}

void WorkQueue::run() {
  for (;;) {
    Work next;
    {
      const Lock hold(_mutex);
      while (_waiting.empty() && !_ending) _changed.wait(_mutex);
      if (_waiting.empty()) return;
      next = std::move(_waiting.front());
      _waiting.pop_front();
    }
    next();
  }
}

}  // namespace veltrad::gateway
