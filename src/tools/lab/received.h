// SPDX-License-Identifier: Apache-2.0
// Stores arrivals: one JSON object per line in received/KIND.jsonl, and the newest lines in memory. Any
// thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "base/mutex.h"
#include "base/value.h"

namespace veltrad::lab {

// Seconds since 1970.
double secondsNow();

// The arrivals of one kind. Each line is one write.
class Received {
 public:
  // Opens or makes the file; ok() tells whether that succeeded.
  explicit Received(std::string path);

  bool ok() const { return _file.isOpen(); }
  const std::string& path() const { return _path; }

  // `body` is a JSON text without line breaks that becomes the value of "body"; none if it is empty.
  void add(const Dictionary& arrival, std::string_view body);
  // Waits for `count` lines since the start, for the time to pass, or for stop(). Returns the number of
  // lines.
  std::uint64_t waitFor(std::uint64_t count, std::chrono::milliseconds time);
  void stop();

  // The range of this run's lines in the file, in bytes.
  std::uint64_t firstByte() const { return _firstByte; }
  std::uint64_t endByte() const;
  // Reads at most `most` bytes of the file at `offset`; empty at the end.
  std::string read(std::uint64_t offset, std::size_t most) const;
  // At most 50 lines, the newest first, each cut after 4 KiB.
  std::deque<std::string> newest() const;

 private:
  // Constant after construction.
  const std::string _path;
  FileDescriptor _file;
  std::uint64_t _firstByte = 0;

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::uint64_t _endByte GUARDED_BY(_mutex) = 0;
  std::uint64_t _count GUARDED_BY(_mutex) = 0;
  bool _stopped GUARDED_BY(_mutex) = false;
  std::deque<std::string> _newest GUARDED_BY(_mutex);
};

// Converts a request's body into JSON without line breaks: JSON stays as it is, other bodies become a text,
// or {"$data": base64} if they are not UTF-8. Empty for an empty body.
std::string bodyAsJSON(const std::string& body);

}  // namespace veltrad::lab
