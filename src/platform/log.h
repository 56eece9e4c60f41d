// SPDX-License-Identifier: Apache-2.0
// The process's log, usable from any thread.
//
//   logDebug("setSessionInfo: Configuring session %u", sessionID);
//
// The format is that of printf, checked by the compiler. A line below the threshold costs one comparison, and
// its arguments are not evaluated. A line is escaped as a whole (base/text.h), one line break at its end is
// dropped, and it is cut with a note if it is longer than its target takes (PIPE_BUF on standard error, 48
// KiB in the journal).
#pragma once

#include <atomic>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace veltrad::platform {

enum class LogLevel : int { error = 3, warning = 4, info = 6, debug = 7 };

namespace log {

// The number of a LogLevel; info at first.
extern std::atomic<int> threshold;

inline bool enabled(LogLevel level) {
  return static_cast<int>(level) <= threshold.load(std::memory_order_relaxed);
}
void write(LogLevel level, const char* format, ...) __attribute__((format(printf, 2, 3)));

// For tests: receives the escaped lines instead of the real log. An empty sink restores the real log.
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

// Error lines that are logged when it goes: after the locks that were taken since it was made.
struct LateErrors {
  LateErrors() = default;
  LateErrors(const LateErrors&) = delete;
  ~LateErrors() {
    for (const std::string& line : lines) logError("%s", line.c_str());
  }
  std::vector<std::string> lines;
};

class VeltraLogging {
 public:
  // Opens the log with this program name and facility ("Daemon"). It is the journal if the service manager
  // has connected standard error to it, else standard error. VELTRA_LOG_TARGET=auto|stderr|syslog and
  // VELTRA_LOG=error|warning|info|debug override this; an unknown value is one warning line that names the
  // choices.
  static void startLogging(std::string_view program, std::string_view facility);
  static void stopLogging();
};

}  // namespace veltrad::platform
