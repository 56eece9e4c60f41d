// Has the disk writer write the counters' file. Main thread.
#pragma once

#include <atomic>
#include <chrono>
#include <string>

#include "platform/disk_writer.h"

namespace veltrad::platform {

class Counters;
class FileStore;

// Everything that the constructor takes must outlive it.
class CountersFile {
 public:
  CountersFile(Counters& counters, FileStore& files, DiskWriter& writer, std::string path, double startedAt);

  // Queues a write if the counters changed and none is queued; never waits for the disk. To be called at most
  // once a second. False if there is no thread to write with; the next call tries again.
  bool writeSoon();
  // Writes the counters as they are now, after everything that is queued. False if `deadline` passed first.
  bool writeLast(std::chrono::steady_clock::time_point deadline);

 private:
  Counters& _counters;
  FileStore& _files;
  DiskWriter& _writer;
  const std::string _path;
  const double _startedAt;
  std::atomic<bool> _asked{false};
  DiskWriter::Queue _queue;
};

}  // namespace veltrad::platform
