// SPDX-License-Identifier: Apache-2.0
// The devices: their starts, sessions and messages, and what happens to them and to the servers.
#pragma once

#include <cstdint>

#include "datagrams.h"
#include "posts.h"
#include "sampling.h"
#include "storebags.h"
#include "world.h"

namespace veltrad::simulate {

class Fleet {
 public:
  // It must outlive this.
  explicit Fleet(const Scenario& scenario);

  // Once.
  void run();
  // "servers" (Traffic::report), "minutes" and "totals" (Census::report).
  Dictionary report() const;

 private:
  void settle(std::uint32_t device);
  void happen(const Event& event);
  void happenTo(const Event& event);

  void boot(std::uint32_t device);
  void planNext(std::uint32_t device, Kind kind, double perHour);
  void follow(std::uint32_t device);
  void newStorebag(std::uint32_t device);
  void message(std::uint32_t device);
  void add(std::uint32_t device, std::uint16_t events);
  void sessionBegins(std::uint32_t device);
  void sessionEnds(std::uint32_t device, bool reports);

  void incident(const Incident& incident, bool begins);
  void cutPower(const Incident& incident);

  World _world;
  Storebags _storebags;
  Posts _posts;
  Datagrams _datagrams;
  Sampling _sampling;
};

}  // namespace veltrad::simulate
