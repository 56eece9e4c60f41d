// SPDX-License-Identifier: Apache-2.0
// Counts calls, and forgets those that are known to have been run.
#include "client/written_calls.h"

#include <algorithm>

namespace veltrad::client {

bool WrittenCalls::shouldAsk(TimePoint now) {
  if (now - _periodBegan >= kPeriod) {
    _periodBegan = now;
    _askedInPeriod = 0;
  }
  if (_askedInPeriod >= kAskedInPeriod && ++_unasked < kMostUnasked) return false;
  ++_askedInPeriod;
  _unasked = 0;
  return true;
}

void WrittenCalls::add(std::uint32_t callID, bool counted) {
  ++_written;
  if (!counted) _uncounted.push_back(_written);
  if (callID != 0) _asked.push_back({callID, _written});
}

void WrittenCalls::answered(std::uint32_t callID) {
  if (_asked.empty()) return;
  // IDs grow, so a smaller one belongs to a call that a later answer has already covered.
  if (static_cast<std::int32_t>(callID - _asked.front().callID) < 0) return;
  const auto at = std::find_if(_asked.begin(), _asked.end(),
                               [callID](const Asked& asked) { return asked.callID == callID; });
  if (at != _asked.end()) ran(at->number);
}

void WrittenCalls::ran(std::uint64_t calls) {
  _ran = std::max(_ran, std::min(calls, _written));
  while (!_uncounted.empty() && _uncounted.front() <= _ran) _uncounted.pop_front();
  while (!_asked.empty() && _asked.front().number <= _ran) _asked.pop_front();
}

void WrittenCalls::clear() {
  _written = _ran = 0;
  _uncounted.clear();
  _asked.clear();
}

}  // namespace veltrad::client
