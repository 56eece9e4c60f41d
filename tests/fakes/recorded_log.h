// The log of one test, kept: an unexpected warning or error fails the test. One at a time; lines from any
// thread.
#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/log.h"

namespace veltrad::inline fakes {

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
      kept->came.notify_all();
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
  // Waits until such a line is there; false, and the test fails, when it does not come. A warning or an error
  // is to be expected besides.
  bool waitForLine(Level level, std::string_view text,
                   std::chrono::milliseconds within = std::chrono::seconds(10)) {
    const Line wanted{level, std::string(text)};
    std::unique_lock lock(_kept->mutex);
    const bool came = _kept->came.wait_for(lock, within, [&] { return countLocked(wanted) > 0; });
    EXPECT_TRUE(came) << "no line of level " << static_cast<int>(level) << " with: " << text;
    return came;
  }
  int count(Level level, std::string_view text) const {
    std::lock_guard lock(_kept->mutex);
    return countLocked({level, std::string(text)});
  }
  std::vector<Line> lines() const {
    std::lock_guard lock(_kept->mutex);
    return _kept->lines;
  }

 private:
  struct Kept {
    std::mutex mutex;
    std::condition_variable came;
    std::vector<Line> lines;
  };

  static bool fits(const Line& line, const Line& wanted) {
    return line.level == wanted.level && line.text.find(wanted.text) != std::string::npos;
  }
  int countLocked(const Line& wanted) const {
    int count = 0;
    for (const Line& line : _kept->lines) count += fits(line, wanted) ? 1 : 0;
    return count;
  }
  void judge() {
    std::vector<Line> left = lines();
    for (const Line& wanted : _expected) {
      auto line = left.begin();
      while (line != left.end() && !fits(*line, wanted)) ++line;
      if (line == left.end()) {
        ADD_FAILURE() << "expected a line of level " << static_cast<int>(wanted.level)
                      << " with: " << wanted.text;
      } else {
        left.erase(line);
      }
    }
    for (const Line& line : left) {
      if (line.level <= Level::warning) {
        ADD_FAILURE() << "unexpected line of level " << static_cast<int>(line.level) << ": " << line.text;
      }
    }
  }

  const std::shared_ptr<Kept> _kept = std::make_shared<Kept>();
  const int _threshold;
  std::vector<Line> _expected;
};

}  // namespace veltrad::inline fakes
