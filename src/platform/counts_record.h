// SPDX-License-Identifier: Apache-2.0
// The counts of a process in a mapped file, for the next process to read if this one is killed.
#pragma once

#include <cstdint>
#include <string>

#include "base/result.h"
#include "platform/counters.h"

namespace veltrad::platform {

class FileStore;

// A process that is killed can settle nothing any more: events in batches and posts under way are lost, and
// what it has counted since it last wrote its counters file is known to nobody. The next one counts both as
// lost ("event lost: the daemon before this one ended"). Used by the thread that made it.
class CountsRecord {
 public:
  // Opens the file (mode 0600), which belongs to whoever holds the daemon's lock, and maps it. It then holds
  // the counts of this process, which begin with what the one before has lost and with its account of the
  // day. `countersPath`: the counters file, as that one left it. Fails if the file cannot be made or mapped.
  static Result<CountsRecord, std::string> open(const std::string& path, FileStore& files,
                                                const std::string& countersPath, double startedAt);
  CountsRecord(CountsRecord&& other) noexcept;
  CountsRecord& operator=(CountsRecord&&) = delete;
  // Unmaps it. The counts must not be used any more.
  ~CountsRecord();

  Counts& counts();
  // The counters file shows all counts. Events that are not settled are still the next process's to count.
  void told();

 private:
  struct Block;
  explicit CountsRecord(Block* block) : _block(block) {}
  static std::uint64_t lostBy(const Block& before, FileStore& files, const std::string& countersPath);

  Block* _block;
};

}  // namespace veltrad::platform
