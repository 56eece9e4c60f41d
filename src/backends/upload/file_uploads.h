// How many files are uploaded at one time. Any thread.
#pragma once

#include <cstddef>

#include "base/mutex.h"

namespace veltrad {

// One for all upload back ends, which it outlives. An upload holds its compressed file in memory from the
// first byte read to the server's answer, so only as many may begin as may be on their way.
class FileUploads {
 public:
  static constexpr std::size_t kMostAtOnce = 2;

  // Waits for one of the places, and gives it back at its end.
  class Place {
   public:
    explicit Place(FileUploads& uploads) : _uploads(uploads) { _uploads.enter(); }
    ~Place() { _uploads.leave(); }
    Place(const Place&) = delete;
    Place& operator=(const Place&) = delete;

   private:
    FileUploads& _uploads;
  };

 private:
  void enter() {
    const Lock held(_mutex);
    while (_underWay == kMostAtOnce) _changed.wait(_mutex);
    ++_underWay;
  }
  void leave() {
    const Lock held(_mutex);
    --_underWay;
    _changed.notifyOne();
  }

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::size_t _underWay GUARDED_BY(_mutex) = 0;
};

}  // namespace veltrad
