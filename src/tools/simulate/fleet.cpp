// SPDX-License-Identifier: Apache-2.0
// Handles the events of the calendar.
#include "fleet.h"

#include <algorithm>
#include <utility>

namespace veltrad::simulate {

namespace {
constexpr double kHour = 3600;
constexpr double kSampleSeconds = 60;
constexpr std::uint16_t kStartAndStop = 2;  // messages of each session beside its own
}  // namespace

Fleet::Fleet(const Scenario& scenario)
    : _world(scenario), _storebags(_world), _posts(_world), _datagrams(_world), _sampling(_world) {
  _world.census.withBag[0] = scenario.devices;
  for (std::uint32_t device = 0; device < scenario.devices; ++device) settle(device);
  for (std::uint32_t i = 0; i < scenario.incidents.size(); ++i) {
    const Incident& one = scenario.incidents[i];
    _world.calendar.addIn(one.at, {i, Kind::incidentBegins, 0, 0});
    _world.calendar.addIn(one.at + one.lasts, {i, Kind::incidentEnds, 0, 0});
  }
  _world.calendar.add(0, {0, Kind::sample, 0, 0});
}

void Fleet::run() {
  _world.calendar.run([this](const Event& event) { happen(event); });
}

Dictionary Fleet::report() const {
  Dictionary report = _world.census.report();
  report.set("servers", _world.traffic.report());
  return report;
}

// In the middle of its life, as if nothing had happened for a long time.
void Fleet::settle(std::uint32_t index) {
  Device& device = _world.devices[index];
  const Scenario& scenario = _world.scenario;
  ++_world.census.on;
  _storebags.settle(index);
  device.factor = _sampling.nextFactor(index);
  const double hoursUp = _world.dice.uniform() * scenario.upDays * 24;
  device.draws =
      static_cast<std::uint16_t>(device.draws + 2 * static_cast<int>(hoursUp * scenario.sessionsPerHour));
  newStorebag(index);
  if (device.standing == Standing::reports) {
    const int most = std::max(_world.bagOf(device).entry.eventThreshold, 0) + 1;
    add(index, static_cast<std::uint16_t>(1 + _world.dice.uniform() * most));
  }
  planNext(index, Kind::message, scenario.messagesPerHour);
  planNext(index, Kind::sessionBegins, scenario.sessionsPerHour);
  if (_world.dice.chance(scenario.sessionsPerHour * scenario.sessionSeconds / kHour)) {  // one is on its way
    const bool reports = _sampling.reports(device, _sampling.nextFactor(index));
    _world.calendar.addIn(_world.dice.uniform() * scenario.sessionSeconds,
                          _world.eventFor(index, Kind::sessionEnds, reports));
  }
  if (scenario.settings.storebags.follow) _storebags.follow(index);
}

void Fleet::happen(const Event& event) {
  switch (event.kind) {
    case Kind::incidentBegins:
      return incident(_world.scenario.incidents[event.device], true);
    case Kind::incidentEnds:
      return incident(_world.scenario.incidents[event.device], false);
    case Kind::sample:
      _world.census.sample(_world.conditions.bag);
      return _world.calendar.addIn(kSampleSeconds, event);
    default:
      if (event.start == _world.devices[event.device].start) happenTo(event);
  }
}

void Fleet::happenTo(const Event& event) {
  switch (event.kind) {
    case Kind::boot:
      return boot(event.device);
    case Kind::refresh:
      if (_storebags.refresh(event.device)) follow(event.device);
      return;
    case Kind::message:
      return message(event.device);
    case Kind::sessionBegins:
      return sessionBegins(event.device);
    case Kind::sessionEnds:
      return sessionEnds(event.device, event.extra != 0);
    case Kind::datagramTick:
      return _datagrams.tick(event.device);
    case Kind::spoolTry:
      return _posts.tryKept(event.device);
    default:
      return;
  }
}

void Fleet::boot(std::uint32_t index) {
  Device& device = _world.devices[index];
  const Scenario& scenario = _world.scenario;
  ++_world.census.on;
  device.on = true;
  device.draws = 0;
  device.eventNumber = 0;
  _storebags.started(index);
  _posts.started(index);
  planNext(index, Kind::message, scenario.messagesPerHour);
  planNext(index, Kind::sessionBegins, scenario.sessionsPerHour);
  // A session that gets no storebag at its start does not get one later.
  if (!_storebags.ask(index)) return;
  device.factor = _sampling.nextFactor(index);
  newStorebag(index);
  ++_world.census.sessions;
  _world.census.sessionsReporting += device.standing == Standing::reports;
  _datagrams.send(index);
  if (device.standing == Standing::reports) add(index, 1);
  if (scenario.settings.storebags.follow) _storebags.follow(index);
}

void Fleet::planNext(std::uint32_t index, Kind kind, double perHour) {
  _world.calendar.addIn(_world.dice.exponential(kHour / perHour), _world.eventFor(index, kind));
}

// The open session goes on with a new storebag: its back ends are made again, and take over its factor.
void Fleet::follow(std::uint32_t index) {
  if (!_world.scenario.settings.storebags.follow || _world.devices[index].standing == Standing::none) return;
  _sampling.nextFactor(index);
  newStorebag(index);
}

// The state of the open session is computed again.
void Fleet::newStorebag(std::uint32_t index) {
  Device& device = _world.devices[index];
  const bool reports = _sampling.reports(device, device.factor);
  _world.stand(device, reports ? Standing::reports : Standing::quiet);
}

void Fleet::message(std::uint32_t index) {
  Device& device = _world.devices[index];
  planNext(index, Kind::message, _world.scenario.messagesPerHour);
  if (device.standing == Standing::none) return;
  _datagrams.send(index);
  if (device.standing == Standing::reports && _sampling.isFull(device)) {
    const std::uint16_t events = device.held;
    _world.census.held -= events;
    device.held = 0;
    _posts.post(index, events, true);
  }
  if (device.standing == Standing::silenced) ++_world.census.lost;
  if (device.standing == Standing::reports) add(index, 1);
}

void Fleet::add(std::uint32_t index, std::uint16_t events) {
  Device& device = _world.devices[index];
  device.held = static_cast<std::uint16_t>(device.held + events);
  _world.census.held += events;
}

void Fleet::sessionBegins(std::uint32_t index) {
  const Device& device = _world.devices[index];
  const Scenario& scenario = _world.scenario;
  planNext(index, Kind::sessionBegins, scenario.sessionsPerHour);
  const std::uint8_t before = device.bag;
  if (!_storebags.ask(index)) return;
  if (device.bag != before) follow(index);
  const bool reports = _sampling.reports(device, _sampling.nextFactor(index));
  ++_world.census.sessions;
  _world.census.sessionsReporting += reports;
  _world.calendar.addIn(scenario.sessionSeconds, _world.eventFor(index, Kind::sessionEnds, reports));
}

void Fleet::sessionEnds(std::uint32_t index, bool reports) {
  const auto messages = static_cast<std::uint16_t>(_world.scenario.messagesPerSession + kStartAndStop);
  for (std::uint16_t i = 0; i < messages; ++i) _datagrams.send(index);
  if (reports) _posts.post(index, messages, false);
}

void Fleet::incident(const Incident& incident, bool begins) {
  Conditions& conditions = _world.conditions;
  switch (incident.what) {
    case Incident::What::storebagsDown:
      conditions.storebagsUp = !begins;
      return;
    case Incident::What::dashboardsDown:
      conditions.dashboardsUp = !begins;
      return;
    case Incident::What::collectorAnswers:
      conditions.status = begins ? incident.status : Conditions().status;
      conditions.retryAfter = begins ? incident.retryAfter : 0;
      return _posts.conditionsChanged();
    case Incident::What::powerCut:
      if (begins) cutPower(incident);
      return;
    case Incident::What::push:
      if (begins) conditions.bag = static_cast<std::uint8_t>(incident.bag + 1);
      return;
  }
}

// Cuts the power of the first devices, which form a region.
void Fleet::cutPower(const Incident& incident) {
  const auto region = static_cast<std::uint32_t>(incident.share * _world.scenario.devices);
  for (std::uint32_t index = 0; index < region; ++index) {
    Device& device = _world.devices[index];
    if (std::exchange(device.on, false)) --_world.census.on;
    ++device.start;
    _world.stand(device, Standing::none);
    _world.census.held -= device.held;
    _world.census.lost += device.held;
    device.held = 0;
    device.datagrams.reset();
    device.storebagsOpen = device.collectorOpen = 0;
    const double bootsIn = incident.lasts + _world.dice.uniform() * incident.bootsWithin;
    _world.calendar.addIn(bootsIn, _world.eventFor(index, Kind::boot));
  }
}

}  // namespace veltrad::simulate
