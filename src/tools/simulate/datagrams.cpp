// SPDX-License-Identifier: Apache-2.0
// Retransmission is the daemon's MessageQueue, its ticks the daemon's DeliverySchedule; the network is
// modelled here.
#include "datagrams.h"

#include <cstring>
#include <string>

#include "backends/dashboard/delivery_schedule.h"

namespace veltrad::simulate {

using backends::DeliverySchedule;
using backends::MessageQueue;

namespace {
DeliverySchedule::Time timeAt(Tick tick) {
  return DeliverySchedule::Time(std::chrono::milliseconds(std::int64_t{tick} * 1000 / kTicksPerSecond));
}
}  // namespace

bool Datagrams::transmit() {
  _world.traffic.sent(Server::dashboards, _world.calendar.now());
  const double loss = _world.scenario.lossOfDatagrams;
  return _world.conditions.dashboardsUp && !_world.dice.chance(loss) && !_world.dice.chance(loss);
}

void Datagrams::send(std::uint32_t index) {
  Device& device = _world.devices[index];
  const std::uint16_t number = ++device.eventNumber;
  if (transmit() || !_world.bagOf(device).reliable) return;
  std::string datagram(sizeof number, '\0');
  std::memcpy(datagram.data(), &number, sizeof number);
  const bool first = !device.datagrams;
  if (first) {
    // Only those that were sent before come here from the queue.
    const auto again = [this](std::string_view waiting, bool isFirst) {
      std::uint16_t its = 0;
      std::memcpy(&its, waiting.data(), sizeof its);
      if (!isFirst && transmit()) _acknowledged.push_back(its);
      return MessageQueue::Sending::done;
    };
    device.datagrams.reset(new KeptDatagrams{MessageQueue(true, false, again), _world.calendar.now()});
  }
  device.datagrams->queue.tryToSendMsg(datagram, number, platform::Charge());
  if (first) plan(index);
}

void Datagrams::tick(std::uint32_t index) {
  Device& device = _world.devices[index];
  MessageQueue& queue = device.datagrams->queue;
  _acknowledged.clear();
  queue.tick();
  for (const std::uint16_t number : _acknowledged) queue.acknowledge(number);
  if (queue.empty()) {
    device.datagrams.reset();
  } else {
    plan(index);
  }
}

void Datagrams::plan(std::uint32_t index) {
  const Device& device = _world.devices[index];
  const auto now = timeAt(_world.calendar.now());
  DeliverySchedule schedule(timeAt(device.datagrams->made), _world.bagOf(device).period);
  const auto next = schedule.next(now, true);
  if (!next) return;
  const double in = std::chrono::duration<double>(*next - now).count();
  _world.calendar.addIn(in, _world.eventFor(index, Kind::datagramTick));
}

}  // namespace veltrad::simulate
