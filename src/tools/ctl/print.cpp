// SPDX-License-Identifier: Apache-2.0
// Writes whole lines.
#include "tools/ctl/print.h"

#include <fmt/format.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>

namespace veltrad::ctl {

bool printLine(std::string_view line) {
  // One call, so that lines of several threads do not mix.
  const std::string whole = std::string(line) + '\n';
  std::fwrite(whole.data(), 1, whole.size(), stdout);
  if (std::fflush(stdout) == 0 && !std::ferror(stdout)) return true;
  complain(fmt::format("Cannot write to standard output: {}.", std::strerror(errno)));
  return false;
}

void remark(std::string_view line) {
  fmt::print(stderr, "{}\n", line);
  std::fflush(stderr);
}

void complain(std::string_view text) {
  fmt::print(stderr, "veltractl: {}\n", text);
  std::fflush(stderr);
}

int printed(std::string_view line) {
  return printLine(line) ? 0 : 1;
}

int refused(std::string_view why, int status) {
  complain(why);
  return status;
}

}  // namespace veltrad::ctl
