// SPDX-License-Identifier: Apache-2.0
// How long a body may keep its connection waiting.
#pragma once

#include <chrono>
#include <cstddef>

namespace veltrad::gateway {

// What is left of a body's time: it gets less while the connection waits for bytes, and more, up to what it
// was at the start, with those that come. A body that comes fast enough never runs out of it.
class BodyPace {
 public:
  using Duration = std::chrono::steady_clock::duration;
  // So many bytes are worth a second.
  static constexpr std::size_t kLeastASecond = 4'096;

  explicit BodyPace(Duration most) : _most(most), _left(most) {}

  Duration left() const { return _left; }
  // `bytes` came after a wait.
  void passed(Duration waited, std::size_t bytes);

 private:
  Duration _most;
  Duration _left;
};

}  // namespace veltrad::gateway
