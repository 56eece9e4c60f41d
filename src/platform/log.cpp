// SPDX-License-Identifier: Apache-2.0
// Writes log lines to the journal, standard error or syslog. A line is one system call.
#include "platform/log.h"

#include <sys/stat.h>
#include <sys/uio.h>
#include <syslog.h>
#include <time.h>
#include <unistd.h>

#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

#include <cerrno>
#include <climits>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <new>
#include <optional>
#include <utility>

#include "base/mutex.h"
#include "base/text.h"

namespace veltrad::platform {

namespace log {

std::atomic<int> threshold{static_cast<int>(LogLevel::info)};

namespace {

// The journal's default limit for a line.
constexpr std::size_t kMostJournalBytes = 48u << 10;
constexpr std::size_t kMostSyslogBytes = 4u << 10;

struct Target {
  enum class Kind { standardError, terminal, journal, syslog };
  Kind kind = Kind::standardError;
  // openlog() keeps a pointer to it.
  std::string program;
  int facility = LOG_USER;
};

// A line may be written while any other lock is held, leaves included.
constexpr LockRank kLogSinkRank{101};

struct State {
  Mutex mutex LEAF_LOCK{kLogSinkRank};
  std::shared_ptr<const Target> target GUARDED_BY(mutex) = std::make_shared<const Target>();
  std::shared_ptr<const Sink> sink GUARDED_BY(mutex);
};

State& state() {
  static State* const only = new State;  // never freed: threads may write lines until the process ends
  return *only;
}

constexpr std::pair<LogLevel, std::string_view> kLevels[] = {{LogLevel::error, "error"},
                                                             {LogLevel::warning, "warning"},
                                                             {LogLevel::info, "info"},
                                                             {LogLevel::debug, "debug"}};

std::string nameOf(LogLevel level) {
  for (const auto& [known, name] : kLevels) {
    if (known == level) return std::string(name);
  }
  return "unknown";
}

// Shortens an escaped line to `most` bytes, with a note on how many were cut.
std::string cut(std::string_view line, std::size_t most) {
  if (line.size() <= most) return std::string(line);
  constexpr std::size_t kLongestNote = 40;
  const std::string_view kept = withoutIncompleteEnd(line.substr(0, most - kLongestNote));
  return std::string(kept) + "… (" + std::to_string(line.size() - kept.size()) + " bytes cut)";
}

std::string localTime() {
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  tm parts{};
  ::localtime_r(&now.tv_sec, &parts);
  char text[32];
  const std::size_t length = ::strftime(text, sizeof text, "%H:%M:%S", &parts);
  std::snprintf(text + length, sizeof text - length, ".%03ld", now.tv_nsec / 1'000'000);
  return text;
}

// Writes at most PIPE_BUF bytes at once, so that lines of several processes are never mixed in a pipe.
void writeToStandardError(const std::string& before, std::string_view line) {
  std::string text = before;
  text += cut(line, PIPE_BUF - before.size() - 1);
  text += '\n';
  // A failure cannot be reported anywhere.
  while (::write(STDERR_FILENO, text.data(), text.size()) < 0 && errno == EINTR) {
  }
}

void writeToJournal(const Target& target, LogLevel level, const std::string& line) {
  const std::string fields[] = {
      "MESSAGE=" + cut(line, kMostJournalBytes), "PRIORITY=" + std::to_string(static_cast<int>(level)),
      "SYSLOG_IDENTIFIER=" + target.program, "SYSLOG_FACILITY=" + std::to_string(target.facility >> 3)};
  iovec vectors[std::size(fields)];
  for (std::size_t i = 0; i < std::size(fields); ++i) {
    vectors[i] = {const_cast<char*>(fields[i].data()), fields[i].size()};
  }
  ::sd_journal_sendv(vectors, static_cast<int>(std::size(vectors)));
}

void writeTo(const Target& target, LogLevel level, const std::string& line) {
  switch (target.kind) {
    case Target::Kind::standardError:
      return writeToStandardError("<" + std::to_string(static_cast<int>(level)) + ">", line);
    case Target::Kind::terminal:
      return writeToStandardError(localTime() + " " + nameOf(level) + ": ", line);
    case Target::Kind::journal:
      return writeToJournal(target, level, line);
    case Target::Kind::syslog:
      return ::syslog(target.facility | static_cast<int>(level), "%s", cut(line, kMostSyslogBytes).c_str());
  }
}

std::string formatted(const char* format, va_list arguments) {
  va_list again;
  va_copy(again, arguments);
  char buffer[1'024];
  const int length = std::vsnprintf(buffer, sizeof buffer, format, arguments);
  std::string text;
  if (length > 0 && static_cast<std::size_t>(length) < sizeof buffer) {
    text.assign(buffer, static_cast<std::size_t>(length));
  } else if (length > 0) {
    text.resize(static_cast<std::size_t>(length));
    std::vsnprintf(text.data(), text.size() + 1, format, again);
  }
  va_end(again);
  return text;
}

bool standardErrorIsTheJournal() {
  // "DEVICE:INODE" of the stream that the service manager made.
  const char* named = std::getenv("JOURNAL_STREAM");
  struct stat status {};
  if (!named || ::fstat(STDERR_FILENO, &status) != 0) return false;
  return named == std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

Target::Kind standardErrorKind() {
  return ::isatty(STDERR_FILENO) == 1 ? Target::Kind::terminal : Target::Kind::standardError;
}

// Absent if there is no such choice.
std::optional<Target::Kind> kindForChoice(std::string_view choice) {
  if (choice == "auto") return standardErrorIsTheJournal() ? Target::Kind::journal : standardErrorKind();
  if (choice == "stderr") return standardErrorKind();
  if (choice != "syslog") return std::nullopt;
  return ::access("/run/systemd/journal/socket", F_OK) == 0 ? Target::Kind::journal : Target::Kind::syslog;
}

std::optional<LogLevel> levelForName(std::string_view name) {
  for (const auto& [level, known] : kLevels) {
    if (known == name) return level;
  }
  return std::nullopt;
}

std::string_view environment(const char* name, std::string_view fallback) {
  const char* value = std::getenv(name);
  return value && *value ? std::string_view(value) : fallback;
}

std::shared_ptr<const Target> exchangeTarget(std::shared_ptr<const Target> target) {
  Lock lock(state().mutex);
  return std::exchange(state().target, std::move(target));
}

void put(LogLevel level, std::string text) {
  if (!text.empty() && text.back() == '\n') text.pop_back();
  const std::string line = escapedForLog(text);

  std::shared_ptr<const Target> target;
  std::shared_ptr<const Sink> sink;
  {
    Lock lock(state().mutex);
    target = state().target;
    sink = state().sink;
  }
  if (sink) return (*sink)(level, line);
  writeTo(*target, level, line);
}

}  // namespace

// Does not throw, because most lines about a lack of memory are written where it was caught.
void write(LogLevel level, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  try {
    put(level, formatted(format, arguments));
  } catch (const std::bad_alloc&) {
    constexpr std::string_view kLost = "<4>A log line is lost: no memory\n";
    [[maybe_unused]] const ssize_t written = ::write(STDERR_FILENO, kLost.data(), kLost.size());
  }
  va_end(arguments);
}

void setSink(Sink sink) {
  auto next = sink ? std::make_shared<const Sink>(std::move(sink)) : nullptr;
  Lock lock(state().mutex);
  state().sink.swap(next);
}

}  // namespace log

void VeltraLogging::startLogging(std::string_view program, std::string_view facility) {
  using log::Target;
  const std::string_view choice = log::environment("VELTRA_LOG_TARGET", "auto");
  const std::string_view level = log::environment("VELTRA_LOG", "info");
  const auto kind = log::kindForChoice(choice);
  const auto threshold = log::levelForName(level);

  ::tzset();  // localtime_r does not read the zone
  const int number = facility == "Daemon" ? LOG_DAEMON : LOG_USER;
  auto target = std::make_shared<const Target>(
      Target{kind ? *kind : *log::kindForChoice("auto"), std::string(program), number});
  if (target->kind == Target::Kind::syslog) ::openlog(target->program.c_str(), LOG_PID, number);
  log::exchangeTarget(std::move(target));
  log::threshold = static_cast<int>(threshold.value_or(LogLevel::info));

  if (!kind) {
    logWarning("VELTRA_LOG_TARGET is \"%s\": expected auto, stderr or syslog; using auto",
               std::string(choice).c_str());
  }
  if (!threshold) {
    logWarning("VELTRA_LOG is \"%s\": expected error, warning, info or debug; using info",
               std::string(level).c_str());
  }
}

void VeltraLogging::stopLogging() {
  const auto last = log::exchangeTarget(std::make_shared<const log::Target>());
  if (last->kind == log::Target::Kind::syslog) ::closelog();
}

}  // namespace veltrad::platform
