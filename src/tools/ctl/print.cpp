// What veltractl writes: results on standard output, everything else on standard error. Any
// thread.
#include "tools/ctl/print.h"

#include <fmt/format.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>

namespace veltrad::ctl {

bool printLine(std::string_view line) {
  const std::string whole = std::string(line) + '\n';  // one call, which takes the stream's lock once
  std::fwrite(whole.data(), 1, whole.size(), stdout);
  if (std::fflush(stdout) == 0 && !std::ferror(stdout)) return true;
  complain(fmt::format("Cannot write to standard output: {}.", std::strerror(errno)));
  return false;
}

void complain(std::string_view text) {
  fmt::print(stderr, "veltractl: {}\n", text);
  std::fflush(stderr);
}

}  // namespace veltrad::ctl
