// SPDX-License-Identifier: Apache-2.0
// Computes ticks and the progress of the clean-up.
#include "backends/dashboard/delivery_schedule.h"

#include <algorithm>

namespace veltrad::backends {

std::optional<DeliverySchedule::Time> DeliverySchedule::next(Time now, bool waiting) {
  _nextTick = std::nullopt;
  if (!waiting && _cleanupState == notRequested) return std::nullopt;
  _nextTick = _made + ((now - _made) / _period + 1) * _period;
  return _lastResort ? std::min(*_nextTick, *_lastResort) : *_nextTick;
}

DeliverySchedule::Verdict DeliverySchedule::cleanup(bool waiting) {
  if (!waiting) return Verdict::stop;
  if (_cleanupState == notRequested) _cleanupState = requested;
  return Verdict::goOn;
}

void DeliverySchedule::resume() {
  _cleanupState = notRequested;
  _lastResort = std::nullopt;
}

DeliverySchedule::Verdict DeliverySchedule::afterTick(Time now, bool waiting) {
  if (_cleanupState == notRequested) return Verdict::goOn;
  if (!waiting) return Verdict::stop;
  if (_cleanupState == lastResort) return Verdict::goOn;
  _cleanupState = lastResort;
  _lastResort = now + kLastResort;
  return Verdict::lastResortScheduled;
}

}  // namespace veltrad::backends
