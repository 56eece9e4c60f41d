// SPDX-License-Identifier: Apache-2.0
// The diagnostic message log: chooses, writes and removes its files.
#include "support/message_log.h"

#include <dirent.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <sys/uio.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstring>
#include <new>
#include <vector>

#include "base/file_descriptor.h"
#include "platform/clock.h"
#include "platform/counters.h"
#include "platform/file_store.h"
#include "platform/log.h"

namespace veltrad::support {

namespace {
constexpr double kExpirySeconds = 86'400;
constexpr std::size_t kLineBytes = 128;       // the memory of a waiting line besides its text
constexpr std::size_t kMostLinesAtOnce = 64;  // lines in one call
constexpr std::string_view kPrefix = "veltrad_";
constexpr std::string_view kSuffix = "_messageLog.diag";

double secondsOf(const struct statx_timestamp& time) {
  return static_cast<double>(time.tv_sec) + time.tv_nsec / 1e9;
}

std::size_t memoryOf(const std::string& line) {
  return line.size() + kLineBytes;
}

// The part between the underscores of a log file's name; absent for any other name.
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

// The earlier of birth and modification time, or without a birth time the seconds in the file's name. In
// seconds since 1970. Links are not followed.
std::optional<double> creationDate(const std::string& path) {
  struct statx facts {};
  if (statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BTIME | STATX_MTIME, &facts) != 0)
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

void appendFilled(std::string& text, std::string_view format,
                  std::initializer_list<std::string_view> values) {
  for (const std::string_view value : values) {
    const std::size_t place = format.find("%@");
    text.append(format.substr(0, place)).append(value);
    format.remove_prefix(place + 2);
  }
  text.append(format);
}

std::string createdText(const std::optional<double>& created) {
  return created ? dateDescription(*created) : "(null)";
}
}  // namespace

// By hand, because strftime() takes as long as the rest of a line.
std::string dateDescription(double secondsSince1970) {
  const std::chrono::sys_seconds time{
      std::chrono::seconds(static_cast<long long>(std::floor(secondsSince1970)))};
  const auto day = std::chrono::floor<std::chrono::days>(time);
  const std::chrono::year_month_day date(day);
  const std::chrono::hh_mm_ss clock(time - day);
  std::string text = std::to_string(int{date.year()});
  const auto append = [&text](char before, auto number) {
    const auto two = static_cast<unsigned>(number);
    const char digits[] = {before, static_cast<char>('0' + two / 10), static_cast<char>('0' + two % 10)};
    text.append(digits, sizeof digits);
  };
  append('-', unsigned{date.month()});
  append('-', unsigned{date.day()});
  append(' ', clock.hours().count());
  append(':', clock.minutes().count());
  append(':', clock.seconds().count());
  return text.append(" +0000");
}

MessageLog::MessageLog(const platform::Clock& clock, std::string directory, platform::DiskWriter& writer,
                       platform::Counters& counters)
    : _clock(clock), _directory(std::move(directory)), _counters(counters), _queue(writer, kMostBytes) {}

void MessageLog::put(std::string_view format, std::initializer_list<std::string_view> values) {
  const double now = platform::timevalToSeconds(_clock.now());
  constexpr std::size_t kDate = 40;
  std::size_t length = kDate + format.size();
  for (const std::string_view value : values) length += value.size();
  // Made in one piece, because a value may be a whole post.
  std::string line;
  line.reserve(length);
  line.append("(").append(dateDescription(now)).append(") ");
  appendFilled(line, format, values);
  line.push_back('\n');
  const std::size_t bytes = memoryOf(line);
  {
    const Lock held(_mutex);
    if (_bytes > 0 && (bytes > kMostBytes || _bytes > kMostBytes - bytes))
      return _counters.count(wire::Reason::log_line_queue_full);
    _waiting.push_back(std::move(line));
    _bytes += bytes;
    if (_waiting.size() > 1) return;
  }
  using Put = platform::DiskWriter::Queue::Put;
  const Put put = _queue.put([this] { writeWaiting(); }, 1);
  if (put == Put::taken) return;
  // No job will write these lines.
  const auto lost = takeWaiting();
  _counters.count(put == Put::full ? wire::Reason::log_line_queue_full : wire::Reason::log_line_no_thread,
                  lost.size());
  end(lost);
}

std::vector<std::string> MessageLog::takeWaiting() {
  std::vector<std::string> lines;
  const Lock held(_mutex);
  lines.swap(_waiting);
  return lines;
}

void MessageLog::end(const std::vector<std::string>& lines) {
  const Lock held(_mutex);
  for (const std::string& line : lines) _bytes -= memoryOf(line);
}

void MessageLog::writeWaiting() {
  const std::vector<std::string> lines = takeWaiting();
  for (std::span<const std::string> left = lines; !left.empty();) {
    const auto some = left.first(std::min(left.size(), kMostLinesAtOnce));
    bool written = false;
    try {
      written = append(some);
    } catch (const std::bad_alloc&) {
    }
    if (!written) _counters.count(wire::Reason::log_line_disk, some.size());
    left = left.subspan(some.size());
  }
  end(lines);
}

bool MessageLog::append(std::span<const std::string> lines) {
  auto file = newestSurvivor();
  if (!file) file = createFile();
  if (!file) return false;
  // Neither follows a link nor blocks.
  const FileDescriptor opened(
      open(file->path.c_str(), O_WRONLY | O_APPEND | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  iovec pieces[kMostLinesAtOnce];
  std::size_t bytes = 0;
  for (std::size_t i = 0; i < lines.size(); ++i) {
    pieces[i] = {const_cast<char*>(lines[i].data()), lines[i].size()};
    bytes += lines[i].size();
  }
  if (writev(opened.get(), pieces, static_cast<int>(lines.size())) != static_cast<ssize_t>(bytes)) {
    remove(*file);
    return false;
  }
  for (std::size_t i = 0; i < lines.size(); ++i)
    logInfo("writeToLogFile: Saved log message to %s", file->path.c_str());
  return true;
}

std::optional<MessageLog::LogFile> MessageLog::newestSurvivor() {
  const FileDescriptor directory(open(_directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directory.isOpen() && errno == ENOENT) {
    logInfo("writeToLogFile: Creating veltrad log directory at %s", _directory.c_str());
    static_cast<void>(platform::makeDirectories(_directory));  // if it fails, making the file fails
    return std::nullopt;
  }
  if (!directory.isOpen()) {
    logError("writeToLogFile: Error reading from log directory: %s", std::strerror(errno));
    return std::nullopt;
  }
  std::vector<std::string> names;
  // opendir() would allocate 32 KiB for each line.
  alignas(dirent64) char entries[4096];
  ssize_t bytes;
  while ((bytes = getdents64(directory.get(), entries, sizeof entries)) > 0) {
    for (ssize_t at = 0; at < bytes;) {
      const auto* entry = reinterpret_cast<const dirent64*>(entries + at);
      if (secondsInLogFileName(entry->d_name)) names.emplace_back(entry->d_name);
      at += entry->d_reclen;
    }
  }
  std::sort(names.begin(), names.end());

  const double now = platform::timevalToSeconds(_clock.now());
  std::optional<LogFile> newest;
  for (const std::string& name : names) {
    LogFile file{_directory + "/" + name, std::nullopt};
    file.created = creationDate(file.path);
    if (file.created && now - *file.created > kExpirySeconds) {
      remove(file);
    } else if (newest && newest->created) {
      const bool later = file.created && *file.created > *newest->created;
      remove(later ? *newest : file);
      if (later) newest = std::move(file);
    } else {
      newest = std::move(file);
    }
  }
  return newest;
}

std::optional<MessageLog::LogFile> MessageLog::createFile() {
  LogFile file{fmt::format("{}/veltrad_{}_messageLog.diag", _directory, _clock.now().seconds), std::nullopt};
  const int made = open(file.path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0640);
  if (made < 0) {
    logError("writeToLogFile: Failed to create new veltrad log file %s", file.path.c_str());
    return std::nullopt;
  }
  close(made);
  file.created = creationDate(file.path);
  logInfo("writeToLogFile: Created new veltrad log file %s (%s)", file.path.c_str(),
          createdText(file.created).c_str());
  return file;
}

void MessageLog::remove(const LogFile& file) {
  ::remove(file.path.c_str());  // also removes an empty directory
  logInfo("writeToLogFile: Deleted expired veltrad log file %s (%s)", file.path.c_str(),
          createdText(file.created).c_str());
}

}  // namespace veltrad::support
