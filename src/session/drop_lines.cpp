// Lines about dropped copies.
#include "session/drop_lines.h"

#include <fmt/printf.h>

#include <cmath>

namespace veltrad {

std::optional<std::string> DropLines::dropped(const std::string& why, double now) {
  ++_unsaid;
  _why = why;
  if (_lastLine && std::abs(now - *_lastLine) < 1) return std::nullopt;
  _lastLine = now;
  return line();
}

std::optional<std::string> DropLines::rest() {
  if (_unsaid == 0) return std::nullopt;
  return line();
}

std::optional<std::string> DropLines::line() {
  std::string text = fmt::sprintf("sendMessageWithDictionary: Failed to get remote object proxy: %s", _why);
  if (_unsaid > 1) text += fmt::sprintf(" (%d copies since the last such line)", _unsaid);
  _unsaid = 0;
  return text;
}

}  // namespace veltrad
