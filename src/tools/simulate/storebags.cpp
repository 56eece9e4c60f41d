// SPDX-License-Identifier: Apache-2.0
// The daemon's StorebagAge decides when to fetch; the server's answers are modelled here.
#include "storebags.h"

#include <algorithm>

#include "config/storebag_download.h"

namespace veltrad::simulate {

Storebags::Storebags(World& world)
    : _world(world), _serverMaxAge(config::maxAgeOfCacheControl(world.scenario.cacheControl)) {}

std::int32_t Storebags::lifetimeOf(const Bag& bag) const {
  return bag.refreshCycle ? static_cast<std::int32_t>(*bag.refreshCycle) : _serverMaxAge;
}

void Storebags::settle(std::uint32_t index) {
  Device& device = _world.devices[index];
  const double jitter = _world.scenario.jitter();
  const std::int32_t lifetime =
      _world.scenario.conditional ? _serverMaxAge : lifetimeOf(_world.scenario.bags.front());
  // At any time more devices are in a long cycle than in a short one.
  double draw = _world.dice.uniform();
  while (_world.dice.uniform() >= 1 - jitter * draw) draw = _world.dice.uniform();
  device.age.ended(true, lifetime, 0, draw);
  device.age.fetchTime = -_world.dice.uniform() * device.age.wait(jitter);
  device.succeeded = static_cast<float>(device.age.fetchTime);
  take(device, 1);
}

void Storebags::started(std::uint32_t index) {
  Device& device = _world.devices[index];
  const std::int32_t lifetime = device.age.lifetime;
  device.age = {};
  if (_world.scenario.settings.storebags.persist && device.bag != 0) {
    device.age.ended(true, lifetime, device.succeeded, _world.dice.uniform());
  } else {
    take(device, 0);
  }
}

bool Storebags::due(const Device& device) const {
  return daemon::verdictOfAge(device.age, _world.calendar.seconds(), _world.scenario.jitter()) ==
         daemon::CacheVerdict::fetch;
}

bool Storebags::ask(std::uint32_t index) {
  Device& device = _world.devices[index];
  if (due(device)) fetch(device);
  return device.bag != 0;
}

void Storebags::fetch(Device& device) {
  const double now = _world.calendar.seconds();
  const double draw = _world.dice.uniform();
  _world.traffic.sent(Server::storebags, _world.calendar.now());
  if (!_world.conditions.storebagsUp) {
    device.age.ended(false, 0, now + _world.scenario.timeout, draw);
    return;
  }
  _world.traffic.answered(Server::storebags, _world.calendar.now(), device.storebagsOpen);
  const std::uint8_t served = _world.conditions.bag;
  const bool notModified = _world.scenario.conditional && device.bag == served;
  // "refresh_cycle" is in the bag, which a 304 does not bring.
  device.age.ended(true, notModified ? _serverMaxAge : lifetimeOf(_world.scenario.bags[served - 1u]), now,
                   draw);
  device.succeeded = static_cast<float>(now);
  take(device, served);
}

void Storebags::take(Device& device, std::uint8_t bag) {
  --_world.census.withBag[device.bag];
  ++_world.census.withBag[bag];
  device.bag = bag;
}

void Storebags::follow(std::uint32_t index) {
  // As in the daemon, which looks once a second.
  constexpr double kShortestCycle = 1;
  const Device& device = _world.devices[index];
  const double now = _world.calendar.seconds();
  const double at = device.age.fetchTime + device.age.wait(_world.scenario.jitter());
  _world.calendar.addIn(std::max(at - now, kShortestCycle), _world.eventFor(index, Kind::refresh));
}

bool Storebags::refresh(std::uint32_t index) {
  Device& device = _world.devices[index];
  const std::uint8_t before = device.bag;
  if (due(device)) fetch(device);  // a session that began may have done it
  follow(index);
  return device.bag != before;
}

}  // namespace veltrad::simulate
