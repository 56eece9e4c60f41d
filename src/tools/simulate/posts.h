// SPDX-License-Identifier: Apache-2.0
// Models how devices post events, keep failed posts, and send them again.
#pragma once

#include <cstdint>
#include <string>

#include "backends/https/spool_waits.h"
#include "world.h"

namespace veltrad::simulate {

class Posts {
 public:
  // It must outlive this.
  explicit Posts(World& world);

  // The collector answers otherwise from now on.
  void conditionsChanged();
  // A batch of so many events is flushed. `open`: of the session that stays open.
  void post(std::uint32_t device, std::uint16_t events, bool open);
  // A try is due.
  void tryKept(std::uint32_t device);
  // The device has started, and finds what it kept.
  void started(std::uint32_t device);

 private:
  // The meaning of a collector's answer, decided by the daemon's code.
  struct Answer {
    bool kept = false;      // with a spool
    bool silences = false;  // without one
    bool loses = false;     // without one
    std::string outcome;
  };
  void keep(Device& device, std::uint16_t events);
  void plan(std::uint32_t device);
  void send(Device& device);

  World& _world;
  const bool _spools;
  const backends::SpoolPace _pace;
  Answer _answer;
};

}  // namespace veltrad::simulate
