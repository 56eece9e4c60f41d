// SPDX-License-Identifier: Apache-2.0
// Keeps the contents of messages while somebody watches them. Any thread.
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

// All watchers read the same queue. The newest contents that fit are kept; positions count from 1 and are
// never reused.
class WatchedContents {
 public:
  static constexpr std::size_t kMostBytes = 4u << 20;
  // Larger contents are not kept. One of this size fits a frame with its fields.
  static constexpr std::size_t kMostOfOne = (1u << 20) - (16u << 10);

  // Contents are kept while a Watch exists.
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

  // To be called before readers can see the message. Costs one comparison without a watcher. Either may be
  // null. Must not contain fields that the owner of the device withholds. For lack of memory nothing is kept,
  // and readers count the message among those whose contents are lost.
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
