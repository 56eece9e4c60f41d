// The counters' file, written by the disk writer. Main thread.
#pragma once

#include <atomic>
#include <chrono>
#include <string>

#include "platform/disk_writer.h"

namespace veltrad::platform {

class Counters;
class FileStore;

// Everything that the constructor takes outlives it.
class CountersFile {
 public:
  CountersFile(Counters& counters, FileStore& files, DiskWriter& writer, std::string path, double startedAt);

  // Has the counters written where they changed, unless a write waits already; never waits for the disk. The
  // owner calls it at most once a second. False: there is no thread to write with; the next call tries again.
  bool writeSoon();
  // The counters as they are now, once all that waits before them is written; false: not before `deadline`.
  bool writeLast(std::chrono::steady_clock::time_point deadline);

 private:
  Counters& _counters;
  FileStore& _files;
  DiskWriter& _writer;
  const std::string _path;
  const double _startedAt;  // seconds since 1970
  std::atomic<bool> _asked{false};
  DiskWriter::Queue _queue;
};

}  // namespace veltrad::platform
