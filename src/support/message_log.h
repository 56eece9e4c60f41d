// The diagnostic message log: a readable record of what the backends sent, one current file. Any thread.
#pragma once

#include <cstddef>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>

#include "platform/disk_writer.h"

namespace veltrad::platform {
class Clock;
class Counters;
}  // namespace veltrad::platform

namespace veltrad::support {

// A text in which each "%@" stands for a value; one whose number differs from `count` does not compile.
template <std::size_t count>
struct MessageFormat {
  consteval MessageFormat(const char* format) : text(format) {
    std::size_t places = 0;
    for (std::size_t at = 0; at + 1 < text.size(); ++at) places += text.substr(at, 2) == "%@" ? 1 : 0;
    if (places != count) throw "the values are not as many as the places for them";
  }
  std::string_view text;
};

// In a directory of its own, files "veltrad_SECONDS_messageLog.diag", one of them current and at most a day
// old. The directory is the only state. Nobody waits for the disk: lines are stamped and queued, and the disk
// writer's thread does the rest; a line that is not written is counted.
class MessageLog {
 public:
  static constexpr std::size_t kMostBytes = 4u << 20;  // of lines that wait; a single one may be longer

  // What it takes outlives it. The directory is made by the first message.
  MessageLog(const platform::Clock& clock, std::string directory, platform::DiskWriter& writer,
             platform::Counters& counters);
  // Appends one time-stamped line.
  template <typename... Values>
  void writeToLogFile(MessageFormat<sizeof...(Values)> format, const Values&... values) {
    put(format.text, {std::string_view(values)...});
  }

 private:
  struct LogFile {
    std::string path;
    std::optional<double> created;  // seconds since 1970
  };
  void put(std::string_view format, std::initializer_list<std::string_view> values);
  bool append(const std::string& line);
  std::optional<LogFile> newestSurvivor();
  std::optional<LogFile> createFile();
  void remove(const LogFile& file);

  // Constant after construction.
  const platform::Clock& _clock;
  const std::string _directory;
  platform::Counters& _counters;

  platform::DiskWriter::Queue _queue;  // last: its end is the end of the writer's work here
};

// "2014-11-16 20:13:54 +0000"
std::string dateDescription(double secondsSince1970);

}  // namespace veltrad::support
