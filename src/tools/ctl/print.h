// What veltractl writes: results on standard output, everything else on standard error. Any
// thread.
#pragma once

#include <string_view>

namespace veltrad::ctl {

// One line, flushed, whole beside the lines of other threads. False when standard output does not take it;
// standard error has been told.
[[nodiscard]] bool printLine(std::string_view line);
// "veltractl: …" on standard error.
void complain(std::string_view text);

}  // namespace veltrad::ctl
