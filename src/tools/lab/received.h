// What has arrived: one JSON object a line in received/KIND.jsonl, the newest lines in memory. Any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/value.h"

namespace veltrad::lab {

// One kind of arrival: events, storebags. Its file is appended to, one write a line.
class Received {
 public:
  // Opens the file, making it where it is missing; ok() tells whether that worked.
  explicit Received(std::string path);
  ~Received();
  Received(const Received&) = delete;
  Received& operator=(const Received&) = delete;

  bool ok() const { return _file >= 0; }
  const std::string& path() const { return _path; }

  // `body` is a JSON text without line breaks, the value of the key "body"; empty: no such key.
  void add(const Dictionary& arrival, std::string_view body);
  // Waits until at least `count` lines have come since the start, or the time is over, or stop(). Returns the
  // count.
  std::uint64_t waitFor(std::uint64_t count, std::chrono::milliseconds time);
  void stop();

  // Where this run's lines begin and end in the file, in bytes.
  std::uint64_t firstByte() const { return _firstByte; }
  std::uint64_t endByte() const;
  // Bytes of the file at `offset`, at most `most`; empty at the end.
  std::string read(std::uint64_t offset, std::size_t most) const;
  // The newest lines, the newest first, each cut after 4 KiB.
  std::deque<std::string> newest() const;

 private:
  // Constant after construction.
  const std::string _path;
  int _file = -1;
  std::uint64_t _firstByte = 0;

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::uint64_t _endByte GUARDED_BY(_mutex) = 0;
  std::uint64_t _count GUARDED_BY(_mutex) = 0;
  bool _stopped GUARDED_BY(_mutex) = false;
  std::deque<std::string> _newest GUARDED_BY(_mutex);  // at most 50
};

// The JSON text, without line breaks, that stands for a request's body: itself when it is JSON, else a text,
// else
// {"$data": base64}. Empty for an empty body.
std::string bodyAsJSON(const std::string& body);

}  // namespace veltrad::lab
