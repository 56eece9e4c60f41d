// SPDX-License-Identifier: Apache-2.0
// `veltractl stats`: reads and prints the daemon's counters.
#include "tools/ctl/commands.h"

#include <fmt/format.h>
#include <signal.h>

#include <cerrno>

#include "platform/file_store.h"
#include "platform/root.h"
#include "tools/ctl/counters_report.h"
#include "tools/ctl/print.h"

namespace veltrad::ctl {
namespace {

constexpr std::size_t kLargestCounters = 4u << 20;

bool isAlive(std::int64_t pid) {
  return pid > 0 && pid <= INT32_MAX && (kill(static_cast<pid_t>(pid), 0) == 0 || errno == EPERM);
}

int noFile(const std::string& path, const platform::FileFailure& failure) {
  using Kind = platform::FileFailure::Kind;
  if (failure.kind == Kind::notFound)
    return refused(fmt::format(
        "No daemon has counted anything in {}: start veltrad, or name its root with VELTRA_ROOT or --root.",
        path));
  if (failure.kind == Kind::noAccess)
    return refused(fmt::format("{}: run veltractl as the user that runs veltrad.", failure.description));
  return refused(failure.description);
}

}  // namespace

int runStats(const Options& options) {
  const auto root = options.root ? platform::Root(*options.root) : platform::Root::fromEnvironment();
  const std::string path = root.countersPath();
  const auto file = platform::DiskFileStore().read(path, kLargestCounters);
  if (!file) return noFile(path, file.error());
  const auto report = readCounters(file.value());
  if (!report)
    return refused(
        fmt::format("{}: expected the counters of veltrad, found something else; restart veltrad.", path));
  std::string_view text = file.value();
  while (!text.empty() && text.back() == '\n') text.remove_suffix(1);
  if (!printLine(options.json ? std::string(text) : formatCounters(*report))) return 1;
  if (isAlive(report->pid)) return 0;
  return refused("veltrad is not running, and these are the counts of its last run: start it for new ones.");
}

}  // namespace veltrad::ctl
