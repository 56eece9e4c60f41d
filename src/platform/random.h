// The process's uniform random draws. Any thread.
#pragma once

#include "base/mutex.h"

namespace veltrad::platform {

class Random {
 public:
  virtual ~Random() = default;
  virtual double uniform() = 0;  // in [0, 1)
};

// The sequence of drand48 never seeded, from a state of our own: every daemon draws alike after a start.
class UnseededSequence final : public Random {
 public:
  double uniform() override;

 private:
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  unsigned short _state[3] GUARDED_BY(_mutex) = {0, 0, 0};
};

}  // namespace veltrad::platform
