// SPDX-License-Identifier: Apache-2.0
// Keeps messages in the order of their tokens and of the times at which they are due.
#include "gateway/held_messages.h"

#include <algorithm>

namespace veltrad::gateway {

const char* reasonOf(Outcome outcome) {
  switch (outcome) {
    case Outcome::late:
      return "held_too_long";
    case Outcome::shortage:
      return "no_memory";
    default:
      return "no_room";
  }
}

bool HeldMessages::add(Message message, Completion& completion, Time now) {
  if (const auto known = _tokens.find(message.id); known != _tokens.end()) {
    std::vector<Waiter>& waiters = _held.at(known->second).waiters;
    waiters.push_back({now, {}});
    waiters.back().completion.swap(completion);
    return true;
  }
  const std::size_t bytes = message.bytes();
  if (_held.size() >= _bounds.messages || _bytes + bytes > _bounds.bytes) return false;
  const std::uint64_t token = _lastToken + 1;
  // What wants memory comes before what changes anything.
  std::map<std::string, std::uint64_t> named{{message.id, token}};
  std::set<std::pair<Time, std::uint64_t>> due{{now, token}};
  Entries entries;
  entries.emplace(token, Held{std::make_shared<const Message>(std::move(message)),
                              {{now, {}}},
                              now,
                              _bounds.again,
                              _bounds.afterRefusal});
  entries.begin()->second.waiters.front().completion.swap(completion);
  _lastToken = token;
  _bytes += bytes;
  _tokens.merge(named);
  _due.merge(due);
  _held.merge(entries);
  return true;
}

void HeldMessages::setDue(Entries::iterator entry, Time due) {
  auto node = _due.extract({entry->second.due, entry->first});
  node.value().first = entry->second.due = due;
  _due.insert(std::move(node));
}

std::optional<HeldMessages::Due> HeldMessages::due(Time now) {
  if (_due.empty() || _due.begin()->first > now) return std::nullopt;
  const auto entry = _held.find(_due.begin()->second);
  Held& held = entry->second;
  setDue(entry, now + held.wait);
  held.wait *= 2;
  return Due{entry->first, held.message};
}

std::vector<HeldMessages::Waiter> HeldMessages::remove(Entries::iterator entry) {
  std::vector<Waiter> waiters = std::move(entry->second.waiters);
  _bytes -= entry->second.message->bytes();
  _tokens.erase(entry->second.message->id);
  _due.erase({entry->second.due, entry->first});
  _held.erase(entry);
  return waiters;
}

std::vector<HeldMessages::Waiter> HeldMessages::taken(std::uint64_t token) {
  const auto entry = _held.find(token);
  return entry == _held.end() ? std::vector<Waiter>() : remove(entry);
}

void HeldMessages::refused(std::uint64_t token, Time now) {
  const auto entry = _held.find(token);
  if (entry == _held.end()) return;
  setDue(entry, now + entry->second.refusalWait);
  entry->second.refusalWait = std::min(2 * entry->second.refusalWait, 4 * _bounds.again);
}

void HeldMessages::allDue(Time now) {
  for (auto entry = _held.begin(); entry != _held.end(); ++entry) setDue(entry, now);
}

std::vector<HeldMessages::Waiter> HeldMessages::expired(Time now) {
  const bool isLate = !_held.empty() && endOf(_held.begin()->second) <= now;
  return isLate ? remove(_held.begin()) : std::vector<Waiter>();
}

void HeldMessages::endBy(Time end) {
  _end = std::min(_end, end);
}

std::optional<HeldMessages::Time> HeldMessages::next() const {
  if (_held.empty()) return std::nullopt;
  return std::min(_due.begin()->first, endOf(_held.begin()->second));
}

}  // namespace veltrad::gateway
