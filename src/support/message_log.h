// SPDX-License-Identifier: Apache-2.0
// The diagnostic message log: a readable record of what the back ends sent. Any thread may write.
#pragma once

#include <cstddef>
#include <initializer_list>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "base/mutex.h"
#include "platform/disk_writer.h"

namespace veltrad::platform {
class Clock;
class Counters;
}  // namespace veltrad::platform

namespace veltrad::support {

// A format in which "%@" stands for a value. It compiles only if there are `count` of them.
template <std::size_t count>
struct MessageFormat {
  consteval MessageFormat(const char* format) : text(format) {
    std::size_t places = 0;
    for (std::size_t at = 0; at + 1 < text.size(); ++at) places += text.substr(at, 2) == "%@" ? 1 : 0;
    if (places != count) throw "the values are not as many as the places for them";
  }
  std::string_view text;
};

// Writes to the newest file "veltrad_SECONDS_messageLog.diag" in its directory and removes the others; a file
// is used for at most a day. Keeps no state besides the directory. Lines are time-stamped and queued, and the
// disk writer's thread writes all that wait at once; lines that are not written are counted.
class MessageLog {
 public:
  // Limit for the lines that wait; a single one may be longer.
  static constexpr std::size_t kMostBytes = 4u << 20;

  // The constructor's arguments must outlive it. The directory is made by the first message.
  MessageLog(const platform::Clock& clock, std::string directory, platform::DiskWriter& writer,
             platform::Counters& counters);
  template <typename... Values>
  void writeToLogFile(MessageFormat<sizeof...(Values)> format, const Values&... values) {
    put(format.text, {std::string_view(values)...});
  }

 private:
  struct LogFile {
    std::string path;
    // Seconds since 1970.
    std::optional<double> created;
  };
  void put(std::string_view format, std::initializer_list<std::string_view> values);
  void writeWaiting();
  // Their bytes count until end().
  std::vector<std::string> takeWaiting();
  void end(const std::vector<std::string>& lines);
  bool append(std::span<const std::string> lines);
  std::optional<LogFile> newestSurvivor();
  std::optional<LogFile> createFile();
  void remove(const LogFile& file);

  // Constant after construction.
  const platform::Clock& _clock;
  const std::string _directory;
  platform::Counters& _counters;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  // If there are any, a job that will take them is queued.
  std::vector<std::string> _waiting GUARDED_BY(_mutex);
  // The bytes of the waiting lines and of those that are being written.
  std::size_t _bytes GUARDED_BY(_mutex) = 0;

  // Last, because its destructor ends the writer's use of the others.
  platform::DiskWriter::Queue _queue;
};

// "2014-11-16 20:13:54 +0000"
std::string dateDescription(double secondsSince1970);

}  // namespace veltrad::support
