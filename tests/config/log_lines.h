// Every line that the code under test logs, for as long as this lives.
#pragma once

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/log.h"

namespace veltrad {

// One test at a time. Lines read "error: TEXT".
class LogLines {
 public:
  LogLines() : _thresholdBefore(platform::log::threshold) {
    platform::log::threshold = static_cast<int>(platform::LogLevel::debug);
    platform::log::setSink([this](platform::LogLevel level, std::string_view line) {
      _lines.push_back(std::string(name(level)) + ": " + std::string(line));
    });
  }
  ~LogLines() {
    platform::log::setSink({});
    platform::log::threshold = _thresholdBefore;
  }

  // What came since the last call.
  std::vector<std::string> take() { return std::exchange(_lines, {}); }
  // The same from info upward.
  std::vector<std::string> takeInfoAndAbove() {
    std::vector<std::string> lines;
    for (std::string& line : take())
      if (!line.starts_with("debug: ")) lines.push_back(std::move(line));
    return lines;
  }

 private:
  static const char* name(platform::LogLevel level) {
    switch (level) {
      case platform::LogLevel::error:
        return "error";
      case platform::LogLevel::warning:
        return "warning";
      case platform::LogLevel::info:
        return "info";
      case platform::LogLevel::debug:
        return "debug";
    }
    return "unknown";
  }

  const int _thresholdBefore;
  std::vector<std::string> _lines;
};

using Lines = std::vector<std::string>;

}  // namespace veltrad
