// SPDX-License-Identifier: Apache-2.0
// The waits are the daemon's SpoolWait, the meaning of an answer its verdicts; the order of posts is modelled
// here, with all sessions of a device as one.
#include "posts.h"

#include <algorithm>
#include <chrono>

#include "backends/https/post_request.h"
#include "backends/https/spool_verdicts.h"

namespace veltrad::simulate {

namespace {
backends::SpoolPace paceOf(const std::optional<config::SpoolChoices>& chosen) {
  if (!chosen) return {};
  return {*chosen->postsPerSecond, *chosen->firstWait, *chosen->longestWait};
}

http::HTTPResult resultOf(const Conditions& conditions) {
  if (conditions.status == 0) return Failure{http::HTTPError{http::HTTPError::Kind::transport, "no answer"}};
  http::HTTPResponse response;
  response.status = conditions.status;
  response.retryAfter = std::chrono::seconds(conditions.retryAfter);
  return response;
}
}  // namespace

Posts::Posts(World& world)
    : _world(world),
      _spools(world.scenario.settings.spool.has_value()),
      _pace(paceOf(world.scenario.settings.spool)) {
  conditionsChanged();
}

void Posts::conditionsChanged() {
  const Conditions& conditions = _world.conditions;
  const http::HTTPResult result = resultOf(conditions);
  _answer = {backends::isToBeKept(result), backends::verdictOfStatus(conditions.status).disablesBackend,
             conditions.status < 200 || conditions.status > 299, backends::outcomeOf(result)};
}

void Posts::send(Device& device) {
  _world.traffic.sent(Server::collector, _world.calendar.now());
  if (_world.conditions.status != 0)
    _world.traffic.answered(Server::collector, _world.calendar.now(), device.collectorOpen);
}

void Posts::post(std::uint32_t index, std::uint16_t events, bool open) {
  Device& device = _world.devices[index];
  const double now = _world.calendar.seconds();
  if (device.posts && (device.posts->wait.refuses(now) || !device.posts->events.empty())) {
    keep(device, events);
    return plan(index);
  }
  send(device);
  if (_spools && _answer.kept) {
    if (!device.posts) device.posts = std::make_unique<KeptPosts>(_pace);
    device.posts->wait.failed(now, false, static_cast<double>(_world.conditions.retryAfter),
                              _world.dice.uniform(), _answer.outcome);
    keep(device, events);
    return plan(index);
  }
  (_answer.loses ? _world.census.lost : _world.census.delivered) += events;
  if (_answer.silences && open) _world.stand(device, Standing::silenced);
}

void Posts::keep(Device& device, std::uint16_t events) {
  device.posts->events.push_back(events);
  ++_world.census.keptPosts;
  _world.census.keptEvents += events;
}

void Posts::plan(std::uint32_t index) {
  // The time of an exchange, after which the next post of a session may leave.
  constexpr double kExchange = 0.2;
  KeptPosts& kept = *_world.devices[index].posts;
  if (kept.planned || kept.events.empty()) return;
  kept.planned = true;
  const double in = kept.wait.next() - _world.calendar.seconds();
  _world.calendar.addIn(std::max(in, kExchange), _world.eventFor(index, Kind::spoolTry));
}

void Posts::tryKept(std::uint32_t index) {
  Device& device = _world.devices[index];
  KeptPosts& kept = *device.posts;
  const double now = _world.calendar.seconds();
  kept.planned = false;
  if (kept.wait.next() > now) return plan(index);
  kept.wait.left(now);
  send(device);
  if (_answer.kept) {
    kept.wait.failed(now, true, static_cast<double>(_world.conditions.retryAfter), _world.dice.uniform(),
                     _answer.outcome);
    return plan(index);
  }
  kept.wait.succeeded();
  const std::uint16_t events = kept.events.front();
  kept.events.erase(kept.events.begin());
  --_world.census.keptPosts;
  _world.census.keptEvents -= events;
  (_answer.loses ? _world.census.lost : _world.census.delivered) += events;
  if (!kept.events.empty()) return plan(index);
  kept.wait.emptied();
  if (!kept.wait.refuses(now)) device.posts.reset();
}

void Posts::started(std::uint32_t index) {
  Device& device = _world.devices[index];
  if (!device.posts || device.posts->events.empty()) {
    device.posts.reset();
    return;
  }
  device.posts->wait = backends::SpoolWait(_pace);
  device.posts->wait.failed(_world.calendar.seconds(), false, 0, _world.dice.uniform(), _answer.outcome);
  device.posts->planned = false;
  plan(index);
}

}  // namespace veltrad::simulate
