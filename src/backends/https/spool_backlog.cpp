// SPDX-License-Identifier: Apache-2.0
// Hands the files out one by one, or all at once.
#include "backends/https/spool_backlog.h"

#include <utility>

namespace veltrad::backends {

bool SpoolBacklog::isToBeListed() {
  const Lock held(_mutex);
  if (_state != State::unknown) return false;
  _state = State::beingListed;
  return true;
}

void SpoolBacklog::listed(std::optional<std::vector<Name>> names) {
  const Lock held(_mutex);
  _state = names ? State::known : State::unknown;
  if (names) _names = std::move(*names);
  _changed.notifyAll();
}

bool SpoolBacklog::isDone() const {
  const Lock held(_mutex);
  return _state == State::known && _next == _names.size() && !_reads;
}

std::optional<SpoolBacklog::Name> SpoolBacklog::next() {
  const Lock held(_mutex);
  if (_next == _names.size() || _takers > 0) return std::nullopt;
  _reads = true;
  return _names[_next];
}

void SpoolBacklog::wasRead(bool done) {
  const Lock held(_mutex);
  _reads = false;
  if (done && ++_next == _names.size()) forget();
  _changed.notifyAll();
}

std::optional<std::vector<SpoolBacklog::Name>> SpoolBacklog::takeAll(Deadline deadline) {
  const Lock held(_mutex);
  ++_takers;
  while (_state == State::beingListed || _reads) {
    if (!_changed.waitUntil(_mutex, deadline)) break;
  }
  --_takers;
  if (_state != State::known || _reads) return std::nullopt;
  std::vector<Name> all(_names.begin() + static_cast<std::ptrdiff_t>(_next), _names.end());
  forget();
  return all;
}

void SpoolBacklog::forget() {
  std::vector<Name>().swap(_names);  // assigning {} would keep the memory
  _next = 0;
}

}  // namespace veltrad::backends
