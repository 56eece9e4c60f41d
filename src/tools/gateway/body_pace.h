// SPDX-License-Identifier: Apache-2.0
// Limits the time that a slow body may take.
#pragma once

#include <chrono>
#include <cstddef>

namespace veltrad::gateway {

// The time left for a body. It decreases while the connection waits for bytes, and increases with received
// bytes, up to the initial value. A body that is fast enough never exhausts it.
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
