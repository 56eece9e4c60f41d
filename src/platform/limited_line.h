// A log line that others can cause at will: said once, then counted. Any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"

namespace veltrad::platform {

// One line at the first occurrence and at most one a second while they go on; each names how many there were
// since the line before it where that is more than one: "… (17 copies since the last such line)". The caller
// logs it, once it holds no lock. Its own lock is a leaf.
class LimitedLine {
 public:
  using Time = std::chrono::steady_clock::time_point;

  // What is counted, in the plural: "copies", "posts".
  explicit LimitedLine(std::string_view counted) : _counted(counted) {}

  // The line to log now, or nothing: it is counted into the next one.
  std::optional<std::string> happened(std::string text, Time now = std::chrono::steady_clock::now());
  // What no line has said yet, with the text of the last; nothing when all was said.
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
