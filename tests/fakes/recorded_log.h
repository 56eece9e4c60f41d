// SPDX-License-Identifier: Apache-2.0
// Records the log of one test: an unexpected warning or error fails the test. One object at a time; lines
// from any thread.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/log.h"

namespace veltrad {

// Everything is kept, debug lines included. Verdict in the destructor: every expected line came, and every
// warning or error was expected.
class RecordedLog {
 public:
  using Level = platform::LogLevel;
  struct Line {
    Level level;
    std::string text;
  };

  RecordedLog() : _threshold(platform::log::threshold.exchange(static_cast<int>(Level::debug))) {
    platform::log::setSink([kept = _kept](Level level, std::string_view line) {
      std::lock_guard lock(kept->mutex);
      kept->lines.push_back({level, std::string(line)});
    });
  }
  ~RecordedLog() {
    platform::log::setSink({});
    platform::log::threshold = _threshold;
    judge();
  }
  RecordedLog(const RecordedLog&) = delete;
  RecordedLog& operator=(const RecordedLog&) = delete;

  // One line of this level that contains `text`, before or after this call; two calls stand for two lines.
  void expectLine(Level level, std::string_view text) { _expected.push_back({level, std::string(text)}); }
  int count(Level level, std::string_view text) const {
    std::lock_guard lock(_kept->mutex);
    return static_cast<int>(std::count_if(_kept->lines.begin(), _kept->lines.end(), [&](const Line& line) {
      return fits(line, {level, std::string(text)});
    }));
  }

 private:
  struct Kept {
    std::mutex mutex;
    std::vector<Line> lines;
  };

  static bool fits(const Line& line, const Line& wanted) {
    return line.level == wanted.level && line.text.find(wanted.text) != std::string::npos;
  }
  void judge() {
    std::lock_guard lock(_kept->mutex);
    std::vector<Line>& left = _kept->lines;
    for (const Line& wanted : _expected) {
      const auto line =
          std::find_if(left.begin(), left.end(), [&](const Line& one) { return fits(one, wanted); });
      if (line != left.end()) {
        left.erase(line);
      } else {
        ADD_FAILURE() << "expected a line of level " << int(wanted.level) << " with: " << wanted.text;
      }
    }
    for (const Line& line : left) {
      if (line.level > Level::warning) continue;
      ADD_FAILURE() << "unexpected line of level " << int(line.level) << ": " << line.text;
    }
  }

  const std::shared_ptr<Kept> _kept = std::make_shared<Kept>();
  const int _threshold;
  std::vector<Line> _expected;
};

}  // namespace veltrad
