// SPDX-License-Identifier: Apache-2.0
// Limits a log line to one a second.
#include "platform/limited_line.h"

#include <utility>

namespace veltrad::platform {

std::optional<std::string> LimitedLine::happened(std::string text, Time now) {
  const Lock held(_mutex);
  ++_unsaid;
  _text = std::move(text);
  if (_lastLine && now - *_lastLine < std::chrono::seconds(1)) return std::nullopt;
  _lastLine = now;
  return line();
}

std::optional<std::string> LimitedLine::rest() {
  const Lock held(_mutex);
  if (_unsaid == 0) return std::nullopt;
  return line();
}

std::string LimitedLine::line() {
  std::string text = std::move(_text);
  _text.clear();
  if (_unsaid > 1) {
    text += " (" + std::to_string(_unsaid) + " " + _counted + " since the last such line)";
  }
  _unsaid = 0;
  return text;
}

}  // namespace veltrad::platform
