// The diagnostic message log: one current file, retired after a day.
#include "support/message_log.h"

#include <dirent.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <ctime>
#include <vector>

#include "platform/clock.h"
#include "platform/counters.h"
#include "platform/file_store.h"
#include "platform/log.h"

namespace veltrad::support {

namespace {
constexpr double kExpirySeconds = 86'400;
constexpr std::size_t kLineBytes = 128;  // what a line that waits keeps beside its text

std::string createdText(const std::optional<double>& created) {
  return created ? dateDescription(*created) : "(null)";
}
}  // namespace

std::string filledFormat(std::string_view format, std::initializer_list<std::string_view> values) {
  std::string text;
  const auto* value = values.begin();
  for (std::size_t at = 0; at < format.size(); ++at) {
    if (format.substr(at, 2) == "%@" && value != values.end()) {
      text += *value++;
      ++at;
    } else {
      text += format[at];
    }
  }
  return text;
}

std::string dateDescription(double secondsSince1970) {
  const auto whole = static_cast<std::time_t>(std::floor(secondsSince1970));
  struct tm parts {};
  gmtime_r(&whole, &parts);
  char text[32];
  const std::size_t length = strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S +0000", &parts);
  return {text, length};
}

MessageLogFile::MessageLogFile(const platform::Clock& clock, std::string directory,
                               platform::DiskWriter& writer, platform::Counters& counters)
    : _clock(clock), _directory(std::move(directory)), _counters(counters), _queue(writer, kMostBytes) {}

void MessageLogFile::writeToLogFile(std::string_view format, std::initializer_list<std::string_view> values) {
  const double now = platform::timevalToSeconds(_clock.now());
  std::string line = fmt::format("({}) {}\n", dateDescription(now), filledFormat(format, values));
  const std::size_t bytes = line.size() + kLineBytes;
  using Put = platform::DiskWriter::Queue::Put;
  switch (_queue.put(
      [this, line = std::move(line)] {
        if (!append(line)) _counters.count(wire::Reason::log_line_disk);
      },
      bytes)) {
    case Put::taken:
      return;
    case Put::full:
      return _counters.count(wire::Reason::log_line_queue_full);
    case Put::noThread:
      return _counters.count(wire::Reason::log_line_no_thread);
  }
}

bool MessageLogFile::append(const std::string& line) {
  const double now = platform::timevalToSeconds(_clock.now());
  if (!currentFileIsOpen(now) && !openCurrentFile()) return false;
  if (!_current.append(line)) {
    remove({_current.path(), _current.created()});
    _current.close();
    return false;
  }
  logInfo("writeToLogFile: Saved log message to %s", _current.path().c_str());
  return true;
}

bool MessageLogFile::currentFileIsOpen(double now) const {
  if (!_current.isCurrent(_directory)) return false;
  const auto created = _current.created();
  return created && now - *created <= kExpirySeconds;
}

bool MessageLogFile::openCurrentFile() {
  _current.close();
  const auto listed = DirectoryState::of(_directory);
  auto file = newestSurvivor();
  if (!file) file = createFile();
  if (!file) return false;
  if (_current.open(file->path, listed)) return true;
  remove(*file);
  return false;
}

std::optional<MessageLogFile::LogFile> MessageLogFile::newestSurvivor() {
  DIR* listing = opendir(_directory.c_str());
  if (!listing && errno == ENOENT) {
    logInfo("writeToLogFile: Creating veltrad log directory at %s", _directory.c_str());
    platform::makeDirectories(_directory);
    return std::nullopt;
  }
  if (!listing) {
    logError("writeToLogFile: Error reading from log directory: %s", std::strerror(errno));
    return std::nullopt;
  }
  std::vector<std::string> names;
  while (const dirent* entry = readdir(listing)) {
    if (secondsInLogFileName(entry->d_name)) names.emplace_back(entry->d_name);
  }
  closedir(listing);
  std::sort(names.begin(), names.end());

  const double now = platform::timevalToSeconds(_clock.now());
  std::optional<LogFile> newest;
  for (const std::string& name : names) {
    LogFile file{_directory + "/" + name, std::nullopt};
    file.created = creationDate(AT_FDCWD, file.path);
    if (file.created && now - *file.created > kExpirySeconds) {
      remove(file);
    } else if (newest && newest->created) {
      const bool later = file.created && *file.created > *newest->created;
      remove(later ? *newest : file);
      if (later) newest = file;
    } else {
      newest = file;
    }
  }
  return newest;
}

std::optional<MessageLogFile::LogFile> MessageLogFile::createFile() {
  LogFile file{fmt::format("{}/veltrad_{}_messageLog.diag", _directory, _clock.now().seconds), std::nullopt};
  const int made = open(file.path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0644);
  if (made < 0) {
    logError("writeToLogFile: Failed to create new veltrad log file %s", file.path.c_str());
    return std::nullopt;
  }
  close(made);
  file.created = creationDate(AT_FDCWD, file.path);
  logInfo("writeToLogFile: Created new veltrad log file %s (%s)", file.path.c_str(),
          createdText(file.created).c_str());
  return file;
}

void MessageLogFile::remove(const LogFile& file) {
  ::remove(file.path.c_str());  // an empty directory of such a name, too
  logInfo("writeToLogFile: Deleted expired veltrad log file %s (%s)", file.path.c_str(),
          createdText(file.created).c_str());
}

}  // namespace veltrad::support
