// SPDX-License-Identifier: Apache-2.0
// Tracks which of the calls written on one connection the daemon has run. Used under its connection's lock.
#pragma once

#include <chrono>
#include <cstdint>
#include <deque>

namespace veltrad::client {

// The daemon runs the calls of a connection one at a time, in order. So an answer shows that its call and all
// before it were run, and the daemon's "goodbye" says how many were. The result of later calls is uncertain.
class WrittenCalls {
 public:
  using TimePoint = std::chrono::steady_clock::time_point;

  // Of calls that want no answer, the first 16 in each 10 ms ask for one all the same, and then every 64th,
  // so that few are uncertain when the daemon is killed and a flood costs hardly more.
  static constexpr unsigned kAskedInPeriod = 16;
  static constexpr std::chrono::milliseconds kPeriod{10};
  static constexpr unsigned kMostUnasked = 64;
  // Whether the next call, which wants no answer, should ask for one.
  bool shouldAsk(TimePoint now);

  // The next call was written. `callID` is 0 if it asks for no answer. If `counted`, it is one of those that
  // are counted when they are lost.
  void add(std::uint32_t callID, bool counted);
  void answered(std::uint32_t callID);
  // The daemon has run the first `calls` of them.
  void ran(std::uint64_t calls);
  void allRan() { ran(_written); }

  // Counted calls that are not known to have been run.
  std::uint64_t uncertain() const { return _written - _ran - _uncounted.size(); }
  // True if an answer that proves further calls run is still expected.
  bool awaitsAnswer() const { return !_asked.empty(); }
  // There is a new connection.
  void clear();

 private:
  struct Asked {
    std::uint32_t callID;
    std::uint64_t number;
  };

  // Calls on this connection, from 1; `_ran` is the last one that is known to have been run.
  std::uint64_t _written = 0;
  std::uint64_t _ran = 0;
  // The numbers after `_ran` of calls that are not counted, which are few.
  std::deque<std::uint64_t> _uncounted;
  // Calls after `_ran` that ask for an answer, in the order of writing.
  std::deque<Asked> _asked;
  TimePoint _periodBegan{};
  unsigned _askedInPeriod = 0;
  unsigned _unasked = 0;
};

}  // namespace veltrad::client
