// SPDX-License-Identifier: Apache-2.0
// Doubles the wait of an address while it fails.
#include "backends/https/spool_waits.h"

#include <algorithm>
#include <utility>

namespace veltrad::backends {

double SpoolWait::nextTry() const {
  return std::max(_retryUntil, _failing ? _nextTry : 0);
}

double SpoolWait::next() const {
  return std::max(_nextLeave, nextTry());
}

void SpoolWait::failed(double now, bool wasTry, double retryAfter, double draw, std::string error) {
  _lastError = std::move(error);
  // Others that fail while a try is awaited change nothing but what the server asks for.
  const bool awaited = wasTry && _failing && now >= _nextTry;
  if (awaited) _wait = std::min(2 * _wait, _pace->longestWait);
  if (awaited || !_failing) _nextTry = now + draw * _wait;
  _failing = true;
  if (retryAfter > 0) _retryUntil = std::max(_retryUntil, now + retryAfter);
}

void SpoolWait::succeeded() {
  emptied();  // a "Retry-After" stands: the post may have begun before it came
}

void SpoolWait::emptied() {
  _failing = false;
  _wait = _pace->firstWait;
  _nextTry = 0;
}

// Late posts are caught up, so that the pace is kept on average; unused time is not saved.
void SpoolWait::left(double now) {
  const double apart = 1 / _pace->postsPerSecond;
  _nextLeave = now - _nextLeave < apart ? _nextLeave + apart : now + apart;
}

void SpoolWait::postponed(double until) {
  _nextLeave = std::max(_nextLeave, until);
}

void SpoolWait::woken(double now, double draw) {
  if (!_failing) return;
  _wait = _pace->firstWait;
  // Routes that come and go do not bring the next try nearer than that.
  if (_nextTry > now + _wait) _nextTry = now + draw * _wait;
}

void SpoolWait::hurried() {
  _nextTry = 0;
  _retryUntil = 0;
}

}  // namespace veltrad::backends
