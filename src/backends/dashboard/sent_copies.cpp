// SPDX-License-Identifier: Apache-2.0
// Keeps the copies in the order in which they were sent.
#include "backends/dashboard/sent_copies.h"

#include <algorithm>

namespace veltrad::backends {

void SentCopies::sent(std::uint64_t datagram, std::uint16_t eventNumber) {
  _copies.push_back({datagram, _tick, eventNumber});
  if (_copies.size() > _most) _copies.pop_front();
}

std::optional<SentCopies::Answered> SentCopies::answered(std::uint16_t eventNumber) {
  const auto copy = std::find_if(_copies.begin(), _copies.end(),
                                 [&](const Copy& one) { return one.eventNumber == eventNumber; });
  if (copy == _copies.end()) return std::nullopt;
  const std::uint64_t datagram = copy->datagram;
  const bool certain =
      std::all_of(_copies.begin(), _copies.end(), [&](const Copy& one) { return one.datagram == datagram; });
  _copies.erase(copy);
  return Answered{datagram, certain};
}

void SentCopies::tick() {
  ++_tick;
  while (!_copies.empty() && _tick - _copies.front().tick > kTicks) _copies.pop_front();
}

}  // namespace veltrad::backends
