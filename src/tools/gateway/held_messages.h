// SPDX-License-Identifier: Apache-2.0
// The messages that the stream has not confirmed yet: decides which are published now, and which have waited
// too long.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "gateway/message.h"

namespace veltrad::gateway {

enum class Outcome {
  // The stream has the message.
  taken,
  // It did not answer in time. It may have the message.
  late,
  // There is no room to hold the message.
  full,
  // There was no memory to hold it.
  shortage,
};
// The name under which what was not taken is counted.
const char* reasonOf(Outcome outcome);

// Decides; the publisher acts. Used by one thread at a time. Only add() wants memory.
class HeldMessages {
 public:
  using Time = std::chrono::steady_clock::time_point;
  using Duration = std::chrono::steady_clock::duration;
  using Completion = std::function<void(Outcome)>;

  struct Bounds {
    std::size_t bytes = 256u << 20;
    std::size_t messages = 16'384;
    // How long a message is held.
    Duration hold = std::chrono::seconds(15);
    // When a message without an answer is published again; each further time after twice as long.
    Duration again = std::chrono::seconds(1);
    // When one that the stream has refused is published again; each further time after twice as long, up to
    // `again` doubled twice.
    Duration afterRefusal = std::chrono::milliseconds(250);
  };

  // Who waits for a message, and since when.
  struct Waiter {
    Time since;
    Completion completion;
  };

  struct Due {
    std::uint64_t token;
    std::shared_ptr<const Message> message;
  };

  explicit HeldMessages(Bounds bounds) : _bounds(bounds) {}

  // Holds the message, which is due at once, and takes the completion. One with the ID of a message that is
  // held joins it. False, or std::bad_alloc: the completion is not taken, and nothing has changed.
  bool add(Message message, Completion& completion, Time now);
  // A message that is to be published now. It is due again later.
  std::optional<Due> due(Time now);
  // Those who waited for a message that the stream has taken; none if it is not held any more.
  std::vector<Waiter> taken(std::uint64_t token);
  // The stream has answered that it does not take the message now.
  void refused(std::uint64_t token, Time now);
  // Everything is due, because the stream can be reached again.
  void allDue(Time now);
  // Those who waited for a message that was held too long; none: there is no such message.
  std::vector<Waiter> expired(Time now);
  // No message is held beyond this time.
  void endBy(Time end);
  // When due() or expired() next has something; absent if nothing is held.
  std::optional<Time> next() const;

  std::size_t messages() const { return _held.size(); }
  std::size_t bytes() const { return _bytes; }

 private:
  struct Held {
    std::shared_ptr<const Message> message;
    // The first is the one with whom it came.
    std::vector<Waiter> waiters;
    Time due;
    Duration wait;
    Duration refusalWait;
  };
  using Entries = std::map<std::uint64_t, Held>;

  std::vector<Waiter> remove(Entries::iterator entry);
  void setDue(Entries::iterator entry, Time due);
  Time endOf(const Held& held) const { return std::min(held.waiters.front().since + _bounds.hold, _end); }

  const Bounds _bounds;
  Time _end = Time::max();
  std::uint64_t _lastToken = 0;
  std::size_t _bytes = 0;
  // By token, so the longest held is the first.
  Entries _held;
  std::map<std::string, std::uint64_t> _tokens;
  std::set<std::pair<Time, std::uint64_t>> _due;
};

}  // namespace veltrad::gateway
