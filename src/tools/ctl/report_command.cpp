// SPDX-License-Identifier: Apache-2.0
// `veltractl report`: shown first, then written.
#include "tools/ctl/commands.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "tools/ctl/print.h"
#include "tools/ctl/report_text.h"

namespace veltrad::ctl {

namespace {

bool agreed(const std::string& file) {
  fmt::print(stderr, "Write this to {}? [y/N] ", file);
  std::fflush(stderr);
  const int answer = std::getchar();
  return answer == 'y' || answer == 'Y';
}

// 0, or an errno. A file that could not be written completely is removed.
int writeNew(const std::string& path, std::string_view text) {
  FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
  if (!file.isOpen()) return errno;
  int error = ::fchmod(file.get(), 0600) == 0 ? 0 : errno;
  if (error == 0) error = writeAll(file.get(), text);
  if (::close(file.release()) != 0 && error == 0) error = errno;
  if (error != 0) ::unlink(path.c_str());
  return error;
}

}  // namespace

int runReport(const Options& options) {
  const auto& output = options.care.output;
  if (output && !options.care.yes && ::isatty(STDIN_FILENO) == 0)
    return refused("--output asks before it writes, and there is no terminal: add --yes.", kWrongUsage);
  struct stat status {};
  if (output && ::lstat(output->c_str(), &status) == 0)
    return refused(fmt::format("{} exists, and a report replaces no file: choose another name.", *output));
  const std::string report = reportText(options);
  if (!printLine(report)) return 1;
  if (!output) return 0;
  if (!options.care.yes && !agreed(*output)) return refused("Nothing was written.");
  if (const int error = writeNew(*output, report + '\n'))
    return refused(fmt::format("{} was not written: {}.", *output, std::strerror(error)));
  fmt::print(stderr, "Written to {}.\n", *output);
  return 0;
}

}  // namespace veltrad::ctl
