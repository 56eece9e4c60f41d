// The diagnostic message log: a readable record of what the backends sent, one current file. Any thread.
#pragma once

#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "support/open_log_file.h"

namespace veltrad {

namespace platform {
class Clock;
}

class MessageLog {
 public:
  virtual ~MessageLog() = default;
  // Appends one time-stamped line: `format` with each "%@" replaced by the next value.
  virtual void writeToLogFile(std::string_view format, std::initializer_list<std::string_view> values) = 0;
};

// In a directory of its own, files "veltrad_SECONDS_messageLog.diag", one of them current and at most a day
// old. The directory is the only state: the current file is held open only while no name came to the
// directory or went from it. The lock covers the whole operation.
class MessageLogFile final : public MessageLog {
 public:
  // The clock outlives it. The directory is made by the first message.
  MessageLogFile(const platform::Clock& clock, std::string directory);
  void writeToLogFile(std::string_view format, std::initializer_list<std::string_view> values) override;

 private:
  struct LogFile {
    std::string path;
    std::optional<double> created;  // seconds since 1970
  };
  bool currentFileIsOpen(double now) const REQUIRES(_mutex);
  bool openCurrentFile() REQUIRES(_mutex);
  std::optional<LogFile> newestSurvivor() REQUIRES(_mutex);
  std::optional<LogFile> createFile() REQUIRES(_mutex);
  void remove(const LogFile& file) REQUIRES(_mutex);

  // Constant after construction.
  const platform::Clock& _clock;
  const std::string _directory;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  OpenLogFile _current GUARDED_BY(_mutex);
};

// "%@" by "%@". Exposed for its table of tests.
std::string filledFormat(std::string_view format, std::initializer_list<std::string_view> values);
// "2014-11-16 20:13:54 +0000"
std::string dateDescription(double secondsSince1970);

}  // namespace veltrad
