// SPDX-License-Identifier: Apache-2.0
// The process's uniform random numbers, for any thread.
#pragma once

#include "base/mutex.h"

namespace veltrad::platform {

class Random {
 public:
  virtual ~Random() = default;
  // In [0, 1).
  virtual double uniform() = 0;
};

// The sequence of an unseeded drand48, with a state of its own: the same numbers after every start.
class UnseededSequence final : public Random {
 public:
  double uniform() override;

 private:
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  unsigned short _state[3] GUARDED_BY(_mutex) = {0, 0, 0};
};

// In [0, 1), from the kernel: other numbers on each device and after each start, so that a fleet does not act
// at once.
double kernelUniform();

}  // namespace veltrad::platform
