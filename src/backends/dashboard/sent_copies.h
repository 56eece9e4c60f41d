// Which datagram an acknowledgement answers where several wait under one event number. One thread at a time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>

namespace veltrad::backends {

// An acknowledgement names an event number alone. It answers the oldest copy of that number that was sent and
// not answered yet, so that each copy confirms once at most: the second answer to a datagram that was sent
// twice finds its own copy and confirms no other datagram. A copy that nobody has answered for 9 ticks, the
// longest that a datagram waits for its next transmission, is taken as lost: from then on it takes no answer
// from another. Where copies were lost, a later answer may go to an earlier datagram, and the later one is
// sent once more than it needed.
class SentCopies {
 public:
  static constexpr std::uint64_t kTicks = 9;

  // `most`: of copies that are remembered; beyond it the oldest is forgotten.
  explicit SentCopies(std::size_t most) : _most(most) {}

  void sent(std::uint64_t datagram, std::uint16_t eventNumber);
  // The datagram of the copy that is answered herewith; nothing: none is on its way.
  std::optional<std::uint64_t> answered(std::uint16_t eventNumber);
  void tick();

 private:
  struct Copy {
    std::uint64_t datagram;
    std::uint64_t tick;
    std::uint16_t eventNumber;
  };
  const std::size_t _most;
  std::deque<Copy> _copies;  // oldest first
  std::uint64_t _tick = 0;
};

}  // namespace veltrad::backends
