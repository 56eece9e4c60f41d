// SPDX-License-Identifier: Apache-2.0
// Models how devices send and repeat datagrams to dashboards.
#pragma once

#include <cstdint>
#include <vector>

#include "world.h"

namespace veltrad::simulate {

class Datagrams {
 public:
  // It must outlive this.
  explicit Datagrams(World& world) : _world(world) {}

  void send(std::uint32_t device);
  // A tick of those that wait.
  void tick(std::uint32_t device);

 private:
  // True if an acknowledgement comes, which takes less than a tick.
  bool transmit();
  void plan(std::uint32_t device);

  World& _world;
  std::vector<std::uint16_t> _acknowledged;  // during one tick
};

}  // namespace veltrad::simulate
