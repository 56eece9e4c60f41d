// SPDX-License-Identifier: Apache-2.0
// The state of a simulation: the devices, the servers, and the counts.
#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "backends/dashboard/message_queue.h"
#include "backends/https/spool_waits.h"
#include "calendar.h"
#include "census.h"
#include "daemon/storebag_age.h"
#include "dice.h"
#include "scenario.h"
#include "traffic.h"

namespace veltrad::simulate {

// The posts in a device's spool.
struct KeptPosts {
  explicit KeptPosts(const backends::SpoolPace& pace) : wait(pace) {}

  backends::SpoolWait wait;
  std::vector<std::uint16_t> events;  // of each post, the oldest first
  bool planned = false;               // a try is in the calendar
};

// The datagrams of a device that are not acknowledged.
struct KeptDatagrams {
  backends::MessageQueue queue;
  Tick made = 0;  // their ticks count from here
};

// The state of the session that a device opens at its start and keeps.
enum class Standing : std::uint8_t {
  none,  // it got no storebag, and gets none later
  quiet,
  reports,
  silenced,
};

// Its 15 fields are what a device is and has.
struct Device {
  daemon::StorebagAge age;
  std::unique_ptr<KeptPosts> posts;
  std::unique_ptr<KeptDatagrams> datagrams;
  double factor = 0;         // of the session that stays open
  double stableFactor = -1;  // negative: not computed yet
  float succeeded = 0;       // when the storebag was had last, in seconds
  Tick storebagsOpen = 0;    // until when its connections are kept
  Tick collectorOpen = 0;
  std::uint16_t draws = 0;  // of sampling factors, since its start
  std::uint16_t held = 0;   // events in the batch
  std::uint16_t eventNumber = 0;
  std::uint8_t start = 0;  // its number
  std::uint8_t bag = 0;    // from 1; 0: none
  Standing standing = Standing::none;
  bool on = true;
};

// The current behaviour of the servers.
struct Conditions {
  bool storebagsUp = true;
  bool dashboardsUp = true;
  int status = 200;  // of the collector; 0: nobody answers
  std::int64_t retryAfter = 0;
  std::uint8_t bag = 1;  // what the storebag server has, from 1
};

struct World {
  explicit World(const Scenario& what)
      : scenario(what),
        calendar(tickAt(what.hours * 3600)),
        dice(what.seed),
        traffic(what.hours * 3600, what.keepAlive),
        devices(what.devices) {}

  const Bag& bagOf(const Device& device) const { return scenario.bags[device.bag - 1u]; }
  void stand(Device& device, Standing standing) {
    census.reporting += (standing == Standing::reports) - (device.standing == Standing::reports);
    census.silenced += (standing == Standing::silenced) - (device.standing == Standing::silenced);
    device.standing = standing;
  }
  Event eventFor(std::uint32_t device, Kind kind, std::uint16_t extra = 0) const {
    return {device, kind, devices[device].start, extra};
  }

  const Scenario& scenario;
  Calendar calendar;
  Dice dice;
  Traffic traffic;
  Census census;
  Conditions conditions;
  std::vector<Device> devices;
};

}  // namespace veltrad::simulate
