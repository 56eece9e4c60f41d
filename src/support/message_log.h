// The diagnostic message log: a readable record of what the backends sent, one current file. Any thread.
#pragma once

#include <cstddef>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>

#include "platform/disk_writer.h"
#include "support/open_log_file.h"

namespace veltrad::platform {
class Clock;
class Counters;
}  // namespace veltrad::platform

namespace veltrad::support {

class MessageLog {
 public:
  virtual ~MessageLog() = default;
  // Appends one time-stamped line: `format` with each "%@" replaced by the next value.
  virtual void writeToLogFile(std::string_view format, std::initializer_list<std::string_view> values) = 0;
};

// In a directory of its own, files "veltrad_SECONDS_messageLog.diag", one of them current and at most a day
// old. The directory is the only state: the current file is held open only while no name came to the
// directory or went from it. Nobody waits for the disk: lines are stamped and queued, and the disk writer's
// thread does the rest; a line that is not written is counted.
class MessageLogFile final : public MessageLog {
 public:
  static constexpr std::size_t kMostBytes = 4u << 20;  // of lines that wait; a single one may be longer

  // What it takes outlives it. The directory is made by the first message.
  MessageLogFile(const platform::Clock& clock, std::string directory, platform::DiskWriter& writer,
                 platform::Counters& counters);
  void writeToLogFile(std::string_view format, std::initializer_list<std::string_view> values) override;

 private:
  struct LogFile {
    std::string path;
    std::optional<double> created;  // seconds since 1970
  };
  bool append(const std::string& line);
  bool currentFileIsOpen(double now) const;
  bool openCurrentFile();
  std::optional<LogFile> newestSurvivor();
  std::optional<LogFile> createFile();
  void remove(const LogFile& file);

  // Constant after construction.
  const platform::Clock& _clock;
  const std::string _directory;
  platform::Counters& _counters;

  // The writer's thread only.
  OpenLogFile _current;

  platform::DiskWriter::Queue _queue;  // last: its end is the end of the writer's work here
};

// "%@" by "%@". Exposed for its table of tests.
std::string filledFormat(std::string_view format, std::initializer_list<std::string_view> values);
// "2014-11-16 20:13:54 +0000"
std::string dateDescription(double secondsSince1970);

}  // namespace veltrad::support
