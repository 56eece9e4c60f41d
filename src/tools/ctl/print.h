// SPDX-License-Identifier: Apache-2.0
// Prints results on standard output and everything else on standard error. Any thread.
#pragma once

#include <string_view>

namespace veltrad::ctl {

// Prints and flushes one line. False, after an error message, if that fails.
[[nodiscard]] bool printLine(std::string_view line);
// Prints one line on standard error.
void remark(std::string_view line);
// Prints "veltractl: …" on standard error.
void complain(std::string_view text);
// Prints a line; gives the status with which to exit.
int printed(std::string_view line);
// Complains; gives the status with which to exit.
int refused(std::string_view why, int status = 1);

}  // namespace veltrad::ctl
