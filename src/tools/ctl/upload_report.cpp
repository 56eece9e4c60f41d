// SPDX-License-Identifier: Apache-2.0
// Reports the progress and the result of an upload.
#include "tools/ctl/upload_report.h"

#include <fmt/format.h>
#include <unistd.h>

#include <cstdio>

#include "base/text.h"
#include "tools/ctl/print.h"

namespace veltrad::ctl {

namespace {

// Moves to the start of the line and clears it.
constexpr const char* kFreshLine = "\r\x1b[K";

std::string fate(const std::string& file, const Answer& answer) {
  const std::string why = answer.error ? answer.error->description : "";
  if (!answer.uploaded) {
    return why.empty() ? fmt::format("Nobody took {}: see what the daemon's log says.", file)
                       : fmt::format("Not uploaded: {}", why);
  }
  if (answer.removed) return fmt::format("Uploaded and removed: {}.", file);
  if (!why.empty()) return fmt::format("Uploaded and kept: {}", why);
  return fmt::format(
      "Uploaded and kept: {}; the server has not confirmed it, or the file has changed, as the "
      "daemon's log says.",
      file);
}

}  // namespace

ClientSession::Progress uploadProgress(const std::string& path) {
  if (::isatty(STDERR_FILENO) == 0) return nullptr;
  return [file = escapedForLog(path)](std::optional<std::chrono::seconds> passed) {
    const std::string line = passed ? fmt::format("Uploading {}: {} s", file, passed->count()) : "";
    fmt::print(stderr, "{}{}", kFreshLine, line);
    std::fflush(stderr);
  };
}

bool reportUpload(const std::string& path, const Answer& answer) {
  complain(fate(escapedForLog(path), answer));
  return answer.uploaded;
}

}  // namespace veltrad::ctl
