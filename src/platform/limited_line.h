// SPDX-License-Identifier: Apache-2.0
// Limits the rate of a log line that clients or servers can trigger. Any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"

namespace veltrad::platform {

// Gives one line for the first occurrence and then at most one a second. A line that stands for several
// occurrences says so: "… (17 copies since the last such line)". The caller logs it, without holding a lock.
class LimitedLine {
 public:
  using Time = std::chrono::steady_clock::time_point;

  // The plural of the counted things: "copies", "posts".
  explicit LimitedLine(std::string_view counted) : _counted(counted) {}

  // The line to log now; absent if the occurrence is only counted.
  std::optional<std::string> happened(std::string text, Time now = std::chrono::steady_clock::now());
  // A line for the occurrences that no line has reported, with the text of the last one; absent if there are
  // none.
  std::optional<std::string> rest();

 private:
  std::string line() REQUIRES(_mutex);

  const std::string _counted;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::optional<Time> _lastLine GUARDED_BY(_mutex);
  std::uint64_t _unsaid GUARDED_BY(_mutex) = 0;
  std::string _text GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
