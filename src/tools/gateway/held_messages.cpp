// SPDX-License-Identifier: Apache-2.0
// Keeps messages in the order of their tokens and of the times at which they are due.
#include "gateway/held_messages.h"

#include <algorithm>

namespace veltrad::gateway {

bool HeldMessages::add(Message message, Completion completion, Time now) {
  if (const auto known = _tokens.find(message.id); known != _tokens.end()) {
    _held.at(known->second).completions.push_back(std::move(completion));
    return true;
  }
  const std::size_t bytes = message.bytes();
  if (_held.size() >= _bounds.messages || _bytes + bytes > _bounds.bytes) return false;
  const std::uint64_t token = ++_lastToken;
  _bytes += bytes;
  _tokens.emplace(message.id, token);
  Held held{
      std::make_shared<const Message>(std::move(message)), {}, now, now, _bounds.again, _bounds.afterRefusal};
  held.completions.push_back(std::move(completion));
  _held.emplace_hint(_held.end(), token, std::move(held));
  _due.emplace(now, token);
  return true;
}

void HeldMessages::setDue(Entries::iterator entry, Time due) {
  _due.erase({entry->second.due, entry->first});
  entry->second.due = due;
  _due.emplace(due, entry->first);
}

std::vector<HeldMessages::Due> HeldMessages::due(Time now) {
  std::vector<Due> found;
  while (!_due.empty() && _due.begin()->first <= now) {
    const auto entry = _held.find(_due.begin()->second);
    Held& held = entry->second;
    found.push_back({entry->first, held.message});
    setDue(entry, now + held.wait);
    held.wait *= 2;
  }
  return found;
}

std::vector<HeldMessages::Completion> HeldMessages::remove(Entries::iterator entry) {
  std::vector<Completion> completions = std::move(entry->second.completions);
  _bytes -= entry->second.message->bytes();
  _tokens.erase(entry->second.message->id);
  _due.erase({entry->second.due, entry->first});
  _held.erase(entry);
  return completions;
}

std::vector<HeldMessages::Completion> HeldMessages::taken(std::uint64_t token) {
  const auto entry = _held.find(token);
  return entry == _held.end() ? std::vector<Completion>() : remove(entry);
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

std::vector<HeldMessages::Completion> HeldMessages::expired(Time now) {
  std::vector<Completion> found;
  while (!_held.empty() && endOf(_held.begin()->second) <= now) {
    for (Completion& completion : remove(_held.begin())) found.push_back(std::move(completion));
  }
  return found;
}

void HeldMessages::endBy(Time end) {
  _end = std::min(_end, end);
}

std::optional<HeldMessages::Time> HeldMessages::next() const {
  if (_held.empty()) return std::nullopt;
  return std::min(_due.begin()->first, endOf(_held.begin()->second));
}

}  // namespace veltrad::gateway
