// SPDX-License-Identifier: Apache-2.0
// A queue in the order of the answers.
#include "testing/late_answers.h"

#include <utility>

namespace veltrad::testing {

LateAnswers::~LateAnswers() {
  {
    Lock lock(_mutex);
    _ending = true;
    _changed.notifyAll();
  }
  _thread.join();
}

void LateAnswers::setDelay(std::chrono::milliseconds delay) {
  Lock lock(_mutex);
  // Without a thread answers are given at once.
  const bool served = _thread.running() || delay.count() == 0 ||
                      _thread.start("late answers", kConnectionStackBytes, [this] { run(); });
  _delay = served ? delay : std::chrono::milliseconds(0);
}

void LateAnswers::give(std::function<void()> answer) {
  {
    Lock lock(_mutex);
    if (_delay.count() > 0 || !_late.empty()) {
      _late.push_back({Clock::now() + _delay, std::move(answer)});
      _changed.notifyAll();
      return;
    }
  }
  answer();
}

void LateAnswers::run() {
  for (;;) {
    std::function<void()> answer;
    {
      Lock lock(_mutex);
      while (!_ending && (_late.empty() || Clock::now() < _late.front().due)) {
        if (_late.empty()) {
          _changed.wait(_mutex);
        } else {
          _changed.waitUntil(_mutex, _late.front().due);
        }
      }
      if (_ending) return;
      answer = std::move(_late.front().answer);
      _late.pop_front();
    }
    answer();
  }
}

}  // namespace veltrad::testing
