// SPDX-License-Identifier: Apache-2.0
// The counts of a process in a mapped file, for the next process to read if this one is killed.
#pragma once

#include <cstdint>
#include <string>

#include "base/result.h"
#include "platform/counters.h"

namespace veltrad::platform {

class FileStore;

// When a process is killed, the events in its batches and open posts are lost, and so are its counts since it
// last wrote its counters file. The next process counts both as lost ("event lost: the daemon before this one
// ended"). Used by the thread that made it.
class CountsRecord {
 public:
  // Opens the file (mode 0600) and maps it; the caller must hold the daemon's lock. The file then holds the
  // counts of this process, which begin with the losses of the previous one and its account of the day.
  // `countersPath`: the counters file, as that one left it. Fails if the file cannot be made or mapped.
  static Result<CountsRecord, std::string> open(const std::string& path, FileStore& files,
                                                const std::string& countersPath, double startedAt);
  CountsRecord(CountsRecord&& other) noexcept;
  CountsRecord& operator=(CountsRecord&&) = delete;
  // Unmaps it. The counts must not be used any more.
  ~CountsRecord();

  Counts& counts();
  // To be called when the counters file shows all counts. The next process still counts events that are not
  // settled.
  void told();

 private:
  struct Block;
  explicit CountsRecord(Block* block) : _block(block) {}
  static std::uint64_t lostBy(const Block& before, FileStore& files, const std::string& countersPath);

  Block* _block;
};

}  // namespace veltrad::platform
