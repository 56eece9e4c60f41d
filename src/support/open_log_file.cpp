// The current log file, and when it was created.
#include "support/open_log_file.h"

#include <fcntl.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>

namespace veltrad::support {

namespace {
constexpr std::string_view kPrefix = "veltrad_";
constexpr std::string_view kSuffix = "_messageLog.diag";
// File times advance with the kernel's tick, 10 ms at most.
constexpr double kSettledSeconds = 0.02;

double secondsOf(const struct statx_timestamp& time) {
  return static_cast<double>(time.tv_sec) + time.tv_nsec / 1e9;
}
}  // namespace

std::optional<std::string_view> secondsInLogFileName(std::string_view name) {
  if (!name.starts_with(kPrefix) || !name.ends_with(kSuffix) ||
      name.size() < kPrefix.size() + kSuffix.size()) {
    return std::nullopt;
  }
  name.remove_prefix(kPrefix.size());
  name.remove_suffix(kSuffix.size());
  if (name.find('_') != std::string_view::npos) return std::nullopt;
  return name;
}

std::optional<double> creationDate(int file, const std::string& path) {
  struct statx facts {};
  const bool opened = file != AT_FDCWD;
  const int flags = opened ? AT_EMPTY_PATH : AT_SYMLINK_NOFOLLOW;
  if (statx(file, opened ? "" : path.c_str(), flags, STATX_BTIME | STATX_MTIME, &facts) != 0)
    return std::nullopt;
  if ((facts.stx_mask & STATX_BTIME) != 0)
    return std::min(secondsOf(facts.stx_btime), secondsOf(facts.stx_mtime));
  const auto digits = secondsInLogFileName(std::string_view(path).substr(path.rfind('/') + 1));
  long long number = 0;
  if (!digits || std::from_chars(digits->data(), digits->data() + digits->size(), number).ec != std::errc()) {
    return std::nullopt;
  }
  return static_cast<double>(number);
}

std::optional<DirectoryState> DirectoryState::of(const std::string& directory) {
  timespec now{};
  clock_gettime(CLOCK_REALTIME_COARSE, &now);
  struct statx facts {};
  if (statx(AT_FDCWD, directory.c_str(), 0, STATX_INO | STATX_MTIME, &facts) != 0) return std::nullopt;
  DirectoryState state;
  state.device = (std::uint64_t{facts.stx_dev_major} << 32) | facts.stx_dev_minor;
  state.inode = facts.stx_ino;
  state.changedSeconds = facts.stx_mtime.tv_sec;
  state.changedNanoseconds = facts.stx_mtime.tv_nsec;
  const double looked = static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
  state.settled = looked - secondsOf(facts.stx_mtime) > kSettledSeconds;
  return state;
}

bool DirectoryState::sameAs(const DirectoryState& later) const {
  return settled && device == later.device && inode == later.inode &&
         changedSeconds == later.changedSeconds && changedNanoseconds == later.changedNanoseconds;
}

bool OpenLogFile::open(std::string path, std::optional<DirectoryState> listed) {
  _file.reset(::open(path.c_str(), O_WRONLY | O_APPEND | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  _path = std::move(path);
  _listed = listed;
  return _file.isOpen();
}

bool OpenLogFile::isCurrent(const std::string& directory) const {
  if (!_file.isOpen() || !_listed) return false;
  const auto now = DirectoryState::of(directory);
  return now && _listed->sameAs(*now);
}

std::optional<double> OpenLogFile::created() const {
  return creationDate(_file.get(), _path);
}

bool OpenLogFile::append(const std::string& line) const {
  return write(_file.get(), line.data(), line.size()) == static_cast<ssize_t>(line.size());
}

}  // namespace veltrad::support
