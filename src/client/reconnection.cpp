// SPDX-License-Identifier: Apache-2.0
// Waits that double up to a bound; each is drawn from its upper half.
#include "client/reconnection.h"

#include <algorithm>

namespace veltrad::client {

std::optional<Reconnection::TimePoint> Reconnection::nextStep() const {
  if (_phase == Phase::waiting || _phase == Phase::greeting) return _next;
  return std::nullopt;
}

bool Reconnection::due(TimePoint now) const {
  const auto next = nextStep();
  return next && *next <= now;
}

void Reconnection::attempted(TimePoint now) {
  if (_phase != Phase::waiting) return;
  _phase = Phase::greeting;
  _next = now + _patience;
}

void Reconnection::greeted(bool starts) {
  if (_phase != Phase::greeting) return;
  _failures = 0;
  _phase = starts ? Phase::starting : Phase::open;
}

void Reconnection::started() {
  if (_phase == Phase::starting) _phase = Phase::open;
}

void Reconnection::ended(TimePoint now, double draw) {
  if (_phase == Phase::over) return;
  constexpr int kMostDoublings = 8;  // beyond that, the longest wait is reached
  const auto most = std::min<std::chrono::milliseconds>(
      kShortestWait * 2 * (1 << std::min(_failures, kMostDoublings)), kLongestWait);
  const std::chrono::duration<double, std::milli> wait = most * (0.5 + 0.5 * std::clamp(draw, 0.0, 1.0));
  ++_failures;
  _phase = Phase::waiting;
  _next = now + std::chrono::ceil<std::chrono::milliseconds>(wait);
}

}  // namespace veltrad::client
