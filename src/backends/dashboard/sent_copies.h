// SPDX-License-Identifier: Apache-2.0
// Finds the datagram that an acknowledgement answers where several datagrams have the same event number.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>

namespace veltrad::backends {

// An acknowledgement contains only an event number. It answers the oldest unanswered copy with that number,
// so the second answer to a datagram that was sent twice does not confirm another datagram. A copy that is
// not answered within 9 ticks, the longest time between two transmissions, is considered lost. If copies were
// lost, an answer may be matched to an earlier datagram; the later one is then sent once more than necessary.
// While copies of several datagrams are unanswered, the match is uncertain.
class SentCopies {
 public:
  static constexpr std::uint64_t kTicks = 9;

  // `most`: how many copies are remembered; further ones replace the oldest.
  explicit SentCopies(std::size_t most) : _most(most) {}

  struct Answered {
    std::uint64_t datagram = 0;
    // No other datagram has an unanswered copy.
    bool certain = false;
  };

  void sent(std::uint64_t datagram, std::uint16_t eventNumber);
  // Returns the datagram whose copy is answered, if any is unanswered.
  std::optional<Answered> answered(std::uint16_t eventNumber);
  void tick();
  // None is unanswered.
  bool empty() const { return _copies.empty(); }

 private:
  struct Copy {
    std::uint64_t datagram;
    std::uint64_t tick;
    std::uint16_t eventNumber;
  };
  const std::size_t _most;
  // Oldest first.
  std::deque<Copy> _copies;
  std::uint64_t _tick = 0;
};

}  // namespace veltrad::backends
