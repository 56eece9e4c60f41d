// SPDX-License-Identifier: Apache-2.0
// What messages hold, kept only while somebody watches. Any thread.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <vector>

#include "base/mutex.h"
#include "base/value.h"

namespace veltrad::platform {

// All who watch read the same. The newest that find room are kept; a position counts them from 1 and is never
// used again.
class WatchedContents {
 public:
  static constexpr std::size_t kMostBytes = 4u << 20;
  // What is larger is not kept. One, and what goes with it, fits a frame.
  static constexpr std::size_t kMostOfOne = (1u << 20) - (16u << 10);

  // Somebody watches while it lives.
  class Watch {
   public:
    explicit Watch(WatchedContents& contents) : _contents(contents) {}
    ~Watch() { _contents.leaves(); }
    Watch(const Watch&) = delete;
    Watch& operator=(const Watch&) = delete;

   private:
    WatchedContents& _contents;
  };
  std::unique_ptr<Watch> watch();

  // Called before readers learn of the message. Without anybody who watches it costs a comparison. Either may
  // be null. Nothing in it may be what the owner of the device keeps back. For want of memory nothing is
  // kept, and readers count the message among those whose contents are lost.
  void keep(std::uint64_t message, const Dictionary* payload, const Dictionary* userInfo) {
    if (_watching.load(std::memory_order_relaxed) > 0) tryToPut(message, payload, userInfo);
  }

  struct Piece {
    std::uint64_t message = 0;
    std::string contents;  // a binary property list of "payload" and "userInfo"; empty: too large
  };
  struct Copy {
    std::vector<Piece> pieces;
    std::uint64_t next = 0;  // where to go on
  };
  // At most kMostOfOne bytes.
  Copy copy(std::uint64_t from) const;
  // The position of the next one.
  std::uint64_t next() const;

 private:
  void tryToPut(std::uint64_t message, const Dictionary* payload, const Dictionary* userInfo);
  void put(std::uint64_t message, const Dictionary* payload, const Dictionary* userInfo);
  void leaves();

  std::atomic<int> _watching{0};
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::deque<Piece> _pieces GUARDED_BY(_mutex);  // oldest first
  std::uint64_t _first GUARDED_BY(_mutex) = 1;   // the oldest one's position
  std::size_t _bytes GUARDED_BY(_mutex) = 0;
};

}  // namespace veltrad::platform
