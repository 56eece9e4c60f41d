// SPDX-License-Identifier: Apache-2.0
// Models how devices fetch their storebag: for new sessions, and for the open session that follows it.
#pragma once

#include <cstdint>

#include "world.h"

namespace veltrad::simulate {

class Storebags {
 public:
  // It must outlive this.
  explicit Storebags(World& world);

  // All have the storebag, and have fetched it at some time within the last cycle.
  void settle(std::uint32_t device);
  // The device has started: it has what it kept.
  void started(std::uint32_t device);
  // A session begins. False: there is no storebag for it.
  bool ask(std::uint32_t device);
  // Plans the next fetch for the open session.
  void follow(std::uint32_t device);
  // That time has come. True if it brought another storebag.
  bool refresh(std::uint32_t device);

 private:
  void fetch(Device& device);
  void take(Device& device, std::uint8_t bag);
  // The lifetime of a whole bag, in seconds.
  std::int32_t lifetimeOf(const Bag& bag) const;
  bool due(const Device& device) const;

  World& _world;
  const std::int32_t _serverMaxAge;
};

}  // namespace veltrad::simulate
