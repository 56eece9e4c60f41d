// SPDX-License-Identifier: Apache-2.0
// Gives answers after a delay. Any thread.
#pragma once

#include <chrono>
#include <deque>
#include <functional>

#include "base/mutex.h"
#include "base/thread.h"

namespace veltrad::testing {

// Its thread starts with the first delay. Answers that are not due when it is destroyed are dropped.
class LateAnswers {
 public:
  using Clock = std::chrono::steady_clock;

  ~LateAnswers();
  // Sets the delay of all further answers.
  void setDelay(std::chrono::milliseconds delay);
  // Runs `answer` when the delay has passed and all earlier answers have been given; at once without any.
  void give(std::function<void()> answer);

 private:
  struct Late {
    Clock::time_point due;
    std::function<void()> answer;
  };
  void run();

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::chrono::milliseconds _delay GUARDED_BY(_mutex){0};
  std::deque<Late> _late GUARDED_BY(_mutex);
  bool _ending GUARDED_BY(_mutex) = false;
  // Started under the lock, joined by the destructor.
  Thread _thread;
};

}  // namespace veltrad::testing
