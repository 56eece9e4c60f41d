// How often the loss of aggregated copies is said. Guarded by its owner.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace veltrad {

// One line at the first drop and at most one a second while drops go on, each with the count since the line
// before it.
class DropLines {
 public:
  // The line to log now, or nothing: the drop is counted into the next one. `now`: seconds of any clock.
  std::optional<std::string> dropped(const std::string& why, double now);
  // What no line has said yet; nothing when all was said.
  std::optional<std::string> rest();

 private:
  std::optional<std::string> line();

  std::optional<double> _lastLine;
  std::uint64_t _unsaid = 0;
  std::string _why;
};

}  // namespace veltrad
