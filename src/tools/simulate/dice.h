// SPDX-License-Identifier: Apache-2.0
// The random numbers of a simulation: the same for the same seed, on every machine.
#pragma once

#include <cmath>
#include <cstdint>

namespace veltrad::simulate {

class Dice {
 public:
  explicit Dice(std::uint64_t seed) : _state(seed) {}

  // The sequence called splitmix64.
  std::uint64_t bits() {
    std::uint64_t mixed = _state += 0x9e3779b97f4a7c15;
    mixed = (mixed ^ mixed >> 30) * 0xbf58476d1ce4e5b9;
    mixed = (mixed ^ mixed >> 27) * 0x94d049bb133111eb;
    return mixed ^ mixed >> 31;
  }
  // In [0, 1).
  double uniform() { return static_cast<double>(bits() >> 11) * 0x1p-53; }
  // The time to the next of events that come at random, `mean` apart.
  double exponential(double mean) { return -mean * std::log1p(-uniform()); }
  bool chance(double share) { return uniform() < share; }

 private:
  std::uint64_t _state;
};

}  // namespace veltrad::simulate
