// What veltractl writes: results on standard output, everything else on standard error. Own thread only.
#include "tools/ctl/print.h"

#include <fmt/format.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

namespace veltrad::ctl {

bool printLine(std::string_view line) {
  std::fwrite(line.data(), 1, line.size(), stdout);
  std::fputc('\n', stdout);
  if (std::fflush(stdout) == 0 && !std::ferror(stdout)) return true;
  complain(fmt::format("Cannot write to standard output: {}.", std::strerror(errno)));
  return false;
}

void complain(std::string_view text) {
  fmt::print(stderr, "veltractl: {}\n", text);
  std::fflush(stderr);
}

}  // namespace veltrad::ctl
