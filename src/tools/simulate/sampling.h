// SPDX-License-Identifier: Apache-2.0
// Decides which sessions report, with the sampling factors of a device and the daemon's own decision.
#pragma once

#include <cstdint>
#include <vector>

#include "world.h"

namespace veltrad::simulate {

class Sampling {
 public:
  // It must outlive this.
  explicit Sampling(World& world);

  // The factor of the next session's back end that posts events. Its back end for dashboards draws before it.
  double nextFactor(std::uint32_t device);
  // The device has the storebag.
  bool reports(const Device& device, double factor) const;
  // Whether it is time to flush a batch before the next event.
  bool isFull(const Device& device) const;

 private:
  double stableFactor(std::uint32_t device);

  World& _world;
  std::vector<double> _drawn;  // the sequence that each device draws from after each start
};

}  // namespace veltrad::simulate
