// Draws that the test chose, in order; the last one again and again. Any thread.
#pragma once

#include <mutex>
#include <utility>
#include <vector>

#include "platform/random.h"

namespace veltrad {

class FakeRandom final : public platform::Random {
 public:
  explicit FakeRandom(std::vector<double> draws = {0.5}) : _draws(std::move(draws)) {}

  double uniform() override {
    std::lock_guard lock(_mutex);
    const double draw = _draws.at(_next);
    if (_next + 1 < _draws.size()) ++_next;
    return draw;
  }

 private:
  std::mutex _mutex;
  const std::vector<double> _draws;
  std::size_t _next = 0;
};

}  // namespace veltrad
