// SPDX-License-Identifier: Apache-2.0
// A file with a state of the process, rewritten after the state has changed. Main thread.
#pragma once

#include <array>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "base/mutex.h"
#include "platform/disk_writer.h"

namespace veltrad::platform {

class FileStore;

// The disk writer replaces the file (mode 0644). The constructor's arguments must outlive it.
class StateFile {
 public:
  // Numbers that differ where the state differs; unused ones are 0.
  using Version = std::array<std::uint64_t, 5>;
  struct State {
    const char* name;  // as its line in the log begins: "The counters"
    // Both are called on the disk writer's thread, the first also on the main thread.
    std::function<Version()> version;
    // The content for the file.
    std::function<std::string()> text;
    // At this version there is nothing to say yet, and no file.
    std::optional<Version> silent = {};
  };

  StateFile(State state, FileStore& files, DiskWriter& writer, std::string path);

  // Queues a write if the version has changed, or the last write failed, and none is queued; never waits for
  // the disk. To be called at most once a second. Only the first failure in a row is logged. False if there
  // is no thread or memory to write with; the next call tries again.
  bool writeSoon();
  // Writes the state as it is now, after everything that is queued. False if `deadline` passed first.
  bool writeLast(std::chrono::steady_clock::time_point deadline);

 private:
  void write();

  const State _state;
  FileStore& _files;
  DiskWriter& _writer;
  const std::string _path;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  // The text in the file is at least as new. Absent after a failure.
  std::optional<Version> _written GUARDED_BY(_mutex);
  std::atomic<bool> _asked{false};
  std::atomic<bool> _failed{false};
  DiskWriter::Queue _queue;
};

}  // namespace veltrad::platform
