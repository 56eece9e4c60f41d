// The process's log: the one process-wide object. Any thread.
//
//   logDebug("setSessionInfo: Configuring session %u", sessionID);
//
// The format is printf's, checked by the compiler, and stands in the code exactly as the user sees it. Below
// the threshold a line costs one comparison and its arguments are not evaluated. A line is escaped as a whole
// (base/text.h); one line break at its end is dropped. One that is longer than its target takes (PIPE_BUF on
// standard error, 48 KiB in the journal) is cut, and says by how much.
#pragma once

#include <atomic>
#include <functional>
#include <string>
#include <string_view>

namespace veltrad::platform {

enum class LogLevel : int { error = 3, warning = 4, info = 6, debug = 7 };

namespace log {

extern std::atomic<int> threshold;  // LogLevel's number; info at start

inline bool enabled(LogLevel level) {
  return static_cast<int>(level) <= threshold.load(std::memory_order_relaxed);
}
void write(LogLevel level, const char* format, ...) __attribute__((format(printf, 2, 3)));

// Where lines go instead of the real log, already escaped; empty: back to the real log. For tests.
using Sink = std::function<void(LogLevel, std::string_view line)>;
void setSink(Sink sink);

}  // namespace log

#define VELTRA_LOG_AT(level, ...)                                                                      \
  do {                                                                                                 \
    if (::veltrad::platform::log::enabled(level)) ::veltrad::platform::log::write(level, __VA_ARGS__); \
  } while (false)
#define logError(...) VELTRA_LOG_AT(::veltrad::platform::LogLevel::error, __VA_ARGS__)
#define logWarning(...) VELTRA_LOG_AT(::veltrad::platform::LogLevel::warning, __VA_ARGS__)
#define logInfo(...) VELTRA_LOG_AT(::veltrad::platform::LogLevel::info, __VA_ARGS__)
#define logDebug(...) VELTRA_LOG_AT(::veltrad::platform::LogLevel::debug, __VA_ARGS__)

class VeltraLogging {
 public:
  // Opens the log under the program name ("veltrad") and facility ("Daemon"): the journal when the service
  // manager connects standard error to it, else standard error. VELTRA_LOG_TARGET=auto|stderr|syslog and
  // VELTRA_LOG=error|warning|info|debug are read here; an unknown value is one warning line that names the
  // choices.
  static void startLogging(std::string_view program, std::string_view facility);
  static void stopLogging();
};

}  // namespace veltrad::platform
