// SPDX-License-Identifier: Apache-2.0
// Guards the batch and keeps its charge up to date.
#include "backends/https/held_events.h"

namespace veltrad::backends {

HeldEvents::~HeldEvents() {
  discard(wire::Reason::ended_before_flush);
}

std::size_t HeldEvents::size() const {
  const Lock held(_mutex);
  return _batch.size();
}

HeldEvents::Need HeldEvents::needOf(std::int32_t method, std::int32_t threshold,
                                    const EventSize& size) const {
  const Lock held(_mutex);
  if (_batch.thresholdReached(method, threshold)) return Need::flush;
  return _batch.full(size) ? Need::bound : Need::room;
}

void HeldEvents::add(std::int32_t method, EventBatch::Event event, platform::Charge charge,
                     std::uint64_t sessionIDChanges, wire::Step step, wire::StepEntry fate) {
  std::size_t dropped = 0;
  std::size_t overShare = 0;
  {
    const Lock held(_mutex);
    for (; _batch.size() > 0 && _batch.full(event.size); ++dropped) dropOldest(wire::Reason::batch_full);
    _charge.add(std::move(charge));
    const bool changed = sessionIDChanges != _sessionIDChanges.load(std::memory_order_relaxed);
    if (changed) {
      changeEvent(event.text,
                  [this](Dictionary& fields) REQUIRES(_mutex) { fields.set("_sessionID", _sessionID); });
      event.size = sizeOfEvent(event.text);
    }
    if (_batchNumber == 0) _batchNumber = _pen.newNumber();
    fate.batch = _batchNumber;
    _pen.write(step, std::nullopt, fate);
    event.message = fate.message;
    _batch.add(method, std::move(event));
    if (dropped > 0 || changed) overShare = settle();
  }
  _counters.count(wire::Reason::batch_full, dropped);
  _counters.count(wire::Reason::event_over_share, overShare);
}

void HeldEvents::restartCount(std::int32_t method) {
  const Lock held(_mutex);
  _batch.restartCount(method);
}

void HeldEvents::setSessionID(const std::string& sessionID) {
  std::size_t dropped = 0;
  {
    const Lock held(_mutex);
    _sessionID = sessionID;
    _sessionIDChanges.fetch_add(1, std::memory_order_release);
    _batch.setSessionID(sessionID);
    dropped = settle();
  }
  _counters.count(wire::Reason::event_over_share, dropped);
}

void HeldEvents::unsettle() {
  const Lock held(_mutex);
  _batch.unsettle();
}

HeldEvents::Taken HeldEvents::take() {
  const Lock held(_mutex);
  return {_batch.take(), std::move(_charge), std::exchange(_batchNumber, 0)};
}

std::size_t HeldEvents::discard(wire::Reason why) {
  const Lock held(_mutex);
  const std::size_t events = _batch.size();
  _counters.count(why, events);
  if (_batch.size() > 0) {
    wire::StepEntry fate;
    fate.batch = std::exchange(_batchNumber, 0);
    _pen.write(wire::Step::dropped, why, fate);
  }
  _batch.discard();
  _charge.release();
  return events;
}

void HeldEvents::dropOldest(wire::Reason why) {
  wire::StepEntry fate;
  fate.batch = _batchNumber;
  fate.message = _batch.dropOldest();
  _pen.write(wire::Step::dropped, why, fate);
}

std::optional<std::uint64_t> HeldEvents::oldestTurn() const {
  const Lock held(_mutex);
  return _batch.oldestTurn();
}

void HeldEvents::dropOldest() {
  {
    const Lock held(_mutex);
    if (_batch.size() == 0) return;
    dropOldest(wire::Reason::event_over_share);
    settle();
  }
  _counters.count(wire::Reason::event_over_share);
}

// Adjusts the charge to the batch. Returns how many events were dropped because the charge could not grow.
std::size_t HeldEvents::settle() {
  if (_charge.bytes() == 0) return 0;  // no account
  std::size_t dropped = 0;
  for (; !_charge.resize(_batch.chargedBytes()); ++dropped) dropOldest(wire::Reason::event_over_share);
  return dropped;
}

}  // namespace veltrad::backends
