// The metrics' file, written by the disk writer. Main thread.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <string>

#include "platform/disk_writer.h"

namespace veltrad::platform {
class FileStore;
}  // namespace veltrad::platform

namespace veltrad::daemon {

class Observers;

// What the constructor takes outlives it.
class MetricsFile {
 public:
  MetricsFile(Observers& observers, platform::FileStore& files, platform::DiskWriter& writer,
              std::string path);

  // Has the file replaced (mode 0644) where a count or a number of sessions, connections or posts changed,
  // unless a write waits already. The owner calls it at most once a second; what failed is tried again at the
  // next call.
  void writeSoon();

 private:
  using Numbers = std::array<std::uint64_t, 4>;
  void write();

  Observers& _observers;
  platform::FileStore& _files;
  const std::string _path;
  std::atomic<bool> _asked{false};
  std::atomic<bool> _failed{false};
  Numbers _written{};  // what was asked to be written last
  platform::DiskWriter::Queue _queue;
};

}  // namespace veltrad::daemon
