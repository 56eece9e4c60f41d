// SPDX-License-Identifier: Apache-2.0
// Finds the next post and the one that has to go.
#include "support/spool_index.h"

#include <algorithm>
#include <iterator>

namespace veltrad::support {

using State = SpoolPlace::State;

std::uint16_t SpoolIndex::addressNumber(const std::string& address) {
  const auto found = std::find(_addresses.begin(), _addresses.end(), address);
  if (found != _addresses.end()) return static_cast<std::uint16_t>(found - _addresses.begin());
  _addresses.push_back(address);
  _amounts.emplace_back();
  return static_cast<std::uint16_t>(_addresses.size() - 1);
}

std::uint16_t SpoolIndex::userNumber(std::uint32_t uid) {
  auto found = std::find_if(_users.begin(), _users.end(), [uid](const User& one) { return one.uid == uid; });
  // Reuses a number without posts, so that there are no more numbers than posts.
  if (found == _users.end())
    found = std::find_if(_users.begin(), _users.end(), [](const User& one) { return one.posts == 0; });
  if (found == _users.end()) found = _users.insert(_users.end(), User{});
  found->uid = uid;
  return static_cast<std::uint16_t>(found - _users.begin());
}

void SpoolIndex::add(const SpoolPlace& place) {
  // At once as large as it may become, so that it is never copied; what is not used takes no memory.
  if (_places.capacity() == 0) _places.reserve(_bounds.posts + _bounds.posts / 8);
  compact();
  _places.insert(_places.begin() + static_cast<std::ptrdiff_t>(firstAfter(place.name.order)), place);
  ++_count;
  _bytes += place.bytes;
  ++_users[place.user].posts;
  _users[place.user].bytes += place.bytes;
  ++_amounts[place.address].posts;
  _amounts[place.address].bytes += place.bytes;
  ++_counts[countOf(place.connection, place.address)];
}

// The first that is later than this.
std::size_t SpoolIndex::firstAfter(std::uint64_t order) const {
  const auto begin = _places.begin() + static_cast<std::ptrdiff_t>(_begin);
  const auto at =
      std::upper_bound(begin, _places.end(), order,
                       [](std::uint64_t one, const SpoolPlace& place) { return one < place.name.order; });
  return static_cast<std::size_t>(at - _places.begin());
}

SpoolPlace* SpoolIndex::find(std::uint64_t order) {
  const std::size_t after = firstAfter(order);
  if (after == _begin) return nullptr;
  SpoolPlace& place = _places[after - 1];
  return place.name.order == order && place.state != State::gone ? &place : nullptr;
}

void SpoolIndex::setBytes(SpoolPlace& place, std::uint32_t bytes) {
  _bytes += std::uint64_t{bytes} - place.bytes;
  _users[place.user].bytes += std::uint64_t{bytes} - place.bytes;
  _amounts[place.address].bytes += std::uint64_t{bytes} - place.bytes;
  place.bytes = bytes;
}

void SpoolIndex::takeOut(SpoolPlace& place) {
  setBytes(place, 0);
  place.state = State::gone;
  --_count;
  --_users[place.user].posts;
  --_amounts[place.address].posts;
  --_counts[countOf(place.connection, place.address)];
  while (_begin < _places.size() && _places[_begin].state == State::gone) ++_begin;
  if (_count == 0) {
    _places.clear();
    _places.shrink_to_fit();
    _begin = 0;
  }
}

void SpoolIndex::compact() {
  if (_places.size() < _places.capacity()) return;
  std::erase_if(_places, [](const SpoolPlace& place) { return place.state == State::gone; });
  _begin = 0;
}

SpoolIndex::Amount SpoolIndex::amountAt(std::uint16_t address) const {
  Amount amount = _amounts[address];
  if (amount.posts == 0) return amount;
  visit(0, [&](const SpoolPlace& place) {
    if (place.address == address) amount.oldest = place.name.order;
    return amount.oldest == 0;
  });
  return amount;
}

bool SpoolIndex::holdsOf(std::uint32_t connection, std::uint16_t address) const {
  if (_counts[countOf(connection, address)] == 0) return false;
  return std::any_of(
      _places.begin() + static_cast<std::ptrdiff_t>(_begin), _places.end(), [&](const SpoolPlace& place) {
        return place.state != State::gone && place.connection == connection && place.address == address;
      });
}

SpoolPlace* SpoolIndex::next(std::uint16_t address, bool oldestAlone,
                             const std::function<bool(const SpoolPlace&)>& blocked) {
  std::vector<std::uint32_t> busy;  // connections with an older one that does not wait
  for (std::size_t at = _begin; at < _places.size(); ++at) {
    SpoolPlace& place = _places[at];
    if (place.state == State::gone || place.address != address) continue;
    const bool first = std::find(busy.begin(), busy.end(), place.connection) == busy.end();
    if (place.state == State::waiting && first && !(blocked && blocked(place))) return &place;
    if (oldestAlone) return nullptr;
    if (first) busy.push_back(place.connection);
  }
  return nullptr;
}

SpoolPlace* SpoolIndex::oldest() {
  if (_count == 0 || _places[_begin].state == State::writing || _places[_begin].state == State::sending)
    return nullptr;
  return &_places[_begin];
}

SpoolPlace* SpoolIndex::oldestOf(std::uint16_t user) {
  for (std::size_t at = _begin; at < _places.size(); ++at) {
    SpoolPlace& place = _places[at];
    if (place.user == user && place.state != State::sending && place.state != State::gone) return &place;
  }
  return nullptr;
}

SpoolPlace* SpoolIndex::excess(Excess& why) {
  const double share = _bounds.perUser * static_cast<double>(_bounds.bytes);
  why = Excess::share;
  for (std::size_t user = 0; user < _users.size(); ++user) {
    if (static_cast<double>(_users[user].bytes) <= share) continue;
    if (SpoolPlace* place = oldestOf(static_cast<std::uint16_t>(user))) return place;
  }
  why = Excess::full;
  if (_bytes <= _bounds.bytes && _count <= _bounds.posts) return nullptr;
  const bool byBytes = _bytes > _bounds.bytes;
  const auto most = std::max_element(_users.begin(), _users.end(), [byBytes](const User& a, const User& b) {
    return byBytes ? a.bytes < b.bytes : a.posts < b.posts;
  });
  return oldestOf(static_cast<std::uint16_t>(most - _users.begin()));
}

}  // namespace veltrad::support
