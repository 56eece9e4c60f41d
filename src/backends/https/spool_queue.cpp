// SPDX-License-Identifier: Apache-2.0
// Keeps the order of posts, of one connection and address above all.
#include "backends/https/spool_queue.h"

#include <algorithm>
#include <chrono>
#include <utility>

#include "backends/https/spool_verdicts.h"
#include "platform/clock.h"
#include "platform/random.h"

namespace veltrad::backends {

using State = support::SpoolPlace::State;

namespace {

double steadyNow() {
  return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

// The address of posts that could not be read yet.
constexpr const char* kNoAddress = "";
constexpr std::uint32_t kNoUser = 0xffff'ffff;

double retryAfterOf(const http::HTTPResult& result) {
  return static_cast<double>((result ? result.value().retryAfter : result.error().retryAfter).count());
}

}  // namespace

double SpoolQueue::wallOffset() const {
  return platform::timevalToSeconds(_clock.now()) - steadyNow();
}

std::uint16_t SpoolQueue::numberOf(const std::string& address) {
  const std::uint16_t number = _index.addressNumber(address);
  while (_waits.size() <= number) _waits.emplace_back(_pace);
  return number;
}

SpoolQueue::Admission SpoolQueue::admit(const std::string& address, std::uint32_t connection) {
  const platform::TimeValue time = _clock.now();
  const auto order = static_cast<std::uint64_t>(time.seconds * 1'000'000 + time.microseconds);
  const Lock held(_mutex);
  Admission admission{_lastOrder = std::max(order, _lastOrder + 1), _emptied, std::nullopt};
  const std::uint16_t number = numberOf(address);
  if (!_allLoaded) {
    admission.refusal = "The spool is being read";
  } else if (_waits[number].refuses(steadyNow())) {
    admission.refusal = _waits[number].lastError();
  } else if (_index.holdsOf(connection, number)) {
    admission.refusal = "Earlier posts of the session are in the spool";
  } else {
    _underWay.push_back({admission.order, connection, number});
  }
  return admission;
}

void SpoolQueue::land(std::uint64_t order) {
  const auto found = std::find_if(_underWay.begin(), _underWay.end(),
                                  [order](const Flight& flight) { return flight.order == order; });
  if (found == _underWay.end()) return;
  *found = _underWay.back();
  _underWay.pop_back();
}

bool SpoolQueue::blocked(const Place& place) const {
  return std::any_of(_underWay.begin(), _underWay.end(), [&place](const Flight& flight) {
    return flight.connection == place.connection && flight.address == place.address &&
           flight.order < place.name.order;
  });
}

void SpoolQueue::landed(std::uint64_t order, const std::string& address, bool answered) {
  const Lock held(_mutex);
  land(order);
  if (answered) _waits[numberOf(address)].succeeded();
}

void SpoolQueue::failed(const std::string& address, const http::HTTPResult& result) {
  const Lock held(_mutex);
  _waits[numberOf(address)].failed(steadyNow(), false, retryAfterOf(result), platform::kernelUniform(),
                                   outcomeOf(result));
}

bool SpoolQueue::add(Place place, const std::string& address, std::uint32_t uid, std::uint64_t emptied) {
  const Lock held(_mutex);
  land(place.name.order);
  place.address = numberOf(address);
  if (emptied != _emptied) {
    if (_index.postsAt(place.address) == 0) _waits[place.address].emptied();
    return false;
  }
  place.user = _index.userNumber(uid);
  _index.add(place);
  return true;
}

void SpoolQueue::addLoaded(Place place, const std::string& address, std::uint32_t uid,
                           const std::string& lastError) {
  const Lock held(_mutex);
  if (Place* unread = _index.find(place.name.order)) remove(*unread);
  place.address = numberOf(address);
  place.user = _index.userNumber(uid);
  place.state = State::waiting;
  _index.add(place);
  _lastOrder = std::max(_lastOrder, place.name.order);
  SpoolWait& wait = _waits[place.address];
  if (!wait.failing()) wait.failed(steadyNow(), false, 0, platform::kernelUniform(), lastError);
}

void SpoolQueue::addUnread(const Name& name, std::uint32_t bytes) {
  Place place;
  place.name = name;
  place.bytes = bytes;
  place.state = State::unread;
  const Lock held(_mutex);
  place.address = numberOf(kNoAddress);
  place.user = _index.userNumber(kNoUser);
  _index.add(place);
  _lastOrder = std::max(_lastOrder, name.order);
}

std::vector<SpoolQueue::Name> SpoolQueue::unread() const {
  std::vector<Name> names;
  const Lock held(_mutex);
  _index.visit(0, [&names](const Place& place) {
    if (place.state == State::unread) names.push_back(place.name);
    return true;
  });
  return names;
}

void SpoolQueue::allLoaded() {
  const Lock held(_mutex);
  _allLoaded = true;
  _loaded.notifyAll();
}

bool SpoolQueue::waitUntilLoaded(std::chrono::steady_clock::time_point deadline) const {
  const Lock held(_mutex);
  while (!_allLoaded) {
    if (!_loaded.waitUntil(_mutex, deadline)) return _allLoaded;
  }
  return true;
}

bool SpoolQueue::setBytes(std::uint64_t order, std::uint32_t bytes) {
  const Lock held(_mutex);
  Place* place = _index.find(order);
  if (place) _index.setBytes(*place, bytes);
  return place != nullptr;
}

std::optional<SpoolQueue::Place> SpoolQueue::written(std::uint64_t order) {
  const Lock held(_mutex);
  Place* place = _index.find(order);
  if (!place) return std::nullopt;
  place->state = State::waiting;
  return *place;
}

bool SpoolQueue::holds(std::uint64_t order) const {
  const Lock held(_mutex);
  return _index.find(order) != nullptr;
}

void SpoolQueue::remove(Place& place) {
  const std::uint16_t address = place.address;
  _index.takeOut(place);
  if (_index.postsAt(address) == 0) _waits[address].emptied();
}

std::optional<SpoolQueue::Place> SpoolQueue::takeOut(std::uint64_t order) {
  const Lock held(_mutex);
  Place* found = _index.find(order);
  if (!found) return std::nullopt;
  const Place place = *found;
  remove(*found);
  return place;
}

std::optional<SpoolQueue::Name> SpoolQueue::excess(support::SpoolIndex::Excess& why) const {
  const Lock held(_mutex);
  const Place* place = _index.excess(why);
  return place ? std::optional(place->name) : std::nullopt;
}

std::optional<SpoolQueue::Name> SpoolQueue::olderThan(std::uint64_t order) const {
  const Lock held(_mutex);
  const Place* place = _index.oldest();
  return place && place->name.order < order ? std::optional(place->name) : std::nullopt;
}

std::uint64_t SpoolQueue::lastOrder() const {
  const Lock held(_mutex);
  return _lastOrder;
}

std::vector<SpoolQueue::Name> SpoolQueue::takeDue(double& next) {
  constexpr double kLongest = 3600;
  std::vector<Name> due;
  const Lock held(_mutex);
  due.reserve(_waits.size());  // first, because it may find no memory
  const double now = steadyNow();
  next = kLongest;
  const auto isBlocked = [this](const Place& place) REQUIRES(_mutex) { return blocked(place); };
  for (std::uint16_t address = 0; address < _waits.size() && _sends && _allLoaded; ++address) {
    SpoolWait& wait = _waits[address];
    if (_index.postsAt(address) == 0) continue;
    if (wait.next() <= now) {
      // An address whose posts are blocked or open asks again when a post ends.
      Place* place = _index.next(address, wait.failing(), isBlocked);
      if (!place) continue;
      place->state = State::sending;
      wait.left(now);
      due.push_back(place->name);
    }
    next = std::min(next, std::max(0.0, wait.next() - now));
  }
  return due;
}

std::optional<SpoolQueue::Place> SpoolQueue::tried(std::uint64_t order, const http::HTTPResult& result) {
  constexpr double kUntilThereIsRoom = 1;
  const bool settles = result && !isToBeKept(result);
  std::string outcome = outcomeOf(result);
  const Lock held(_mutex);
  Place* found = _index.find(order);
  if (!found) return std::nullopt;
  found->tries = static_cast<std::uint16_t>(std::min(0xffff, found->tries + triesOf(result)));
  found->state = State::waiting;
  const Place place = *found;
  SpoolWait& wait = _waits[place.address];
  if (settles) {
    wait.succeeded();
    remove(*found);
  } else if (tellsOfServer(result)) {
    wait.failed(steadyNow(), true, retryAfterOf(result), platform::kernelUniform(), std::move(outcome));
  } else {
    wait.postponed(steadyNow() + kUntilThereIsRoom);
  }
  return place;
}

void SpoolQueue::putBack(std::uint64_t order, double seconds) {
  const Lock held(_mutex);
  Place* found = _index.find(order);
  if (!found || found->state != State::sending) return;
  found->state = State::waiting;
  _waits[found->address].postponed(steadyNow() + seconds);
}

void SpoolQueue::woken() {
  const Lock held(_mutex);
  for (SpoolWait& wait : _waits) wait.woken(steadyNow(), platform::kernelUniform());
}

std::size_t SpoolQueue::hurry() {
  const Lock held(_mutex);
  for (SpoolWait& wait : _waits) wait.hurried();
  return _index.size();
}

std::vector<SpoolQueue::Name> SpoolQueue::empty() {
  std::vector<Name> names;
  const Lock held(_mutex);
  ++_emptied;
  names.reserve(_index.size());
  _index.visit(0, [&names](const Place& place) {
    names.push_back(place.name);
    return true;
  });
  return names;
}

void SpoolQueue::stopSending() {
  const Lock held(_mutex);
  _sends = false;
}

std::vector<SpoolQueue::Name> SpoolQueue::names(std::uint64_t after, std::size_t most) const {
  std::vector<Name> names;
  const Lock held(_mutex);
  _index.visit(after, [&](const Place& place) {
    if (place.state != State::writing) names.push_back(place.name);
    return names.size() < most;
  });
  return names;
}

std::optional<SpoolQueue::Name> SpoolQueue::named(const support::PostID& id) const {
  std::optional<Name> found;
  const Lock held(_mutex);
  _index.visit(0, [&](const Place& place) {
    if (place.name.id == id) found = place.name;
    return !found;
  });
  return found;
}

SpoolQueue::AddressStatus SpoolQueue::statusOf(std::uint16_t address) const {
  AddressStatus status{_index.address(address), _index.amountAt(address), _waits[address].nextTry(),
                       _waits[address].lastError()};
  if (status.nextTry > 0) status.nextTry += wallOffset();
  return status;
}

std::vector<SpoolQueue::AddressStatus> SpoolQueue::addresses() const {
  std::vector<AddressStatus> all;
  const Lock held(_mutex);
  for (std::size_t i = 0; i < _waits.size(); ++i) {
    const auto address = static_cast<std::uint16_t>(i);
    if (_index.postsAt(address) > 0 && _index.address(address) != kNoAddress)
      all.push_back(statusOf(address));
  }
  return all;
}

std::optional<SpoolQueue::Place> SpoolQueue::place(std::uint64_t order) const {
  const Lock held(_mutex);
  const Place* found = _index.find(order);
  return found ? std::optional(*found) : std::nullopt;
}

SpoolQueue::AddressStatus SpoolQueue::statusAt(std::uint16_t address) const {
  const Lock held(_mutex);
  return statusOf(address);
}

double SpoolQueue::waitAt(std::uint16_t address) const {
  const Lock held(_mutex);
  return std::max(0.0, _waits[address].nextTry() - steadyNow());
}

support::SpoolIndex::Amount SpoolQueue::amount() const {
  support::SpoolIndex::Amount amount;
  const Lock held(_mutex);
  amount.posts = _index.size();
  amount.bytes = _index.bytes();
  _index.visit(0, [&amount](const Place& place) {
    amount.oldest = place.name.order;
    return false;
  });
  return amount;
}

}  // namespace veltrad::backends
