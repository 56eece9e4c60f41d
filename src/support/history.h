// SPDX-License-Identifier: Apache-2.0
// Records what left the device, for its owner. Any thread records; the disk writer's thread writes.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "base/file_descriptor.h"
#include "base/mutex.h"
#include "base/value.h"
#include "platform/disk_writer.h"
#include "support/history_folder.h"

namespace veltrad::platform {
class Clock;
}  // namespace veltrad::platform

namespace veltrad::support {

// Each departure has a record with its body, made when it begins, and a second record with the result, which
// names the first. Records wait in memory until the next writeSoon(), which writes and syncs all of them.
// Records that cannot be written keep waiting.
//
// Its 13 fields are what the records are made with, and those that wait.
class History {
 public:
  // Records wait for the disk; beyond these bytes there is no room for another one.
  static constexpr std::size_t kMostBytes = 4u << 20;
  // A body larger than this part of the space is kept only as length and digest.
  static constexpr std::uint64_t kLargestShare = 4;

  // Bytes of a departure, in memory or, so many, in a file.
  struct Body {
    std::string_view bytes;
    std::shared_ptr<const FileDescriptor> file;
    std::uint64_t fileBytes = 0;
  };

  // The constructor's arguments must outlive it.
  History(const platform::Clock& clock, std::string directory, platform::DiskWriter& writer);

  // Sets the space; absent stops recording. Files on disk stay.
  void keep(std::optional<HistorySpace> space);
  bool keeps() const { return _keeps.load(std::memory_order_relaxed); }
  bool hasRoom() const { return !keeps() || _waitingBytes.load(std::memory_order_relaxed) < kMostBytes; }
  // Adds "id", "time" and, to one of a body that is too large, "sha256" and "kept" (false) to the header.
  // Takes the record whether there is room or not. Returns its number; 0: nothing is recorded.
  std::uint64_t begins(Dictionary header, const Body& body);
  // `end`: {"status", "error", "transmissions"}.
  void ended(std::uint64_t number, Dictionary end);

  // Repairs the files, once, before anything else is written.
  void mend();
  // Queues a write if something waits, and once a day one that removes what is too old. To be called several
  // times a second.
  void writeSoon();
  // Waits until the writer has tried to put on disk what was recorded before. False if `deadline` passed
  // first.
  bool writeNow(std::chrono::steady_clock::time_point deadline);
  // Removes all of it. Nothing if the disk writer cannot do it by the deadline, or has no memory for it.
  std::optional<HistoryFolder::Removed> purge(std::chrono::steady_clock::time_point deadline);
  const std::string& directory() const { return _directory; }

 private:
  void put(HistoryRecord record);
  void write();
  std::uint64_t nextNumber();

  const platform::Clock& _clock;
  const std::string _directory;
  std::atomic<bool> _keeps{false};
  std::atomic<std::size_t> _waitingBytes{0};
  std::atomic<bool> _asked{false};

  // The disk writer's thread only.
  HistoryFolder _folder;
  bool _failed = false;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  HistorySpace _space GUARDED_BY(_mutex);
  HistoryRecords _waiting GUARDED_BY(_mutex);
  std::uint64_t _lastNumber GUARDED_BY(_mutex) = 0;
  std::int64_t _trimmedOn GUARDED_BY(_mutex) = 0;

  // Last, because its destructor ends the writer's use of the others.
  platform::DiskWriter::Queue _queue;
};

}  // namespace veltrad::support
