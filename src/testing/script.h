// SPDX-License-Identifier: Apache-2.0
// The messages that have arrived, and the test's instructions. Any thread.
#pragma once

#include <chrono>
#include <cstddef>
#include <deque>
#include <optional>
#include <string>

#include "base/mutex.h"
#include "base/value.h"
#include "veltra/value.hpp"

namespace veltrad::testing {

class Script {
 public:
  // A message, with the keys of veltra_testing_message().
  void take(const Dictionary& message);
  std::size_t count();
  // False if fewer have come by then.
  bool waitFor(std::size_t count, std::chrono::steady_clock::time_point deadline);
  // Valid as long as this object; null if there is none.
  const veltra_value* message(std::size_t index);

  // Absent: nothing is refused.
  void refuse(std::optional<std::string> text);
  std::optional<std::string> refusal();

 private:
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _came;
  std::deque<veltra::Value> _messages GUARDED_BY(_mutex);
  std::optional<std::string> _refusal GUARDED_BY(_mutex);
};

}  // namespace veltrad::testing
