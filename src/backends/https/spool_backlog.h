// SPDX-License-Identifier: Apache-2.0
// The files that an earlier daemon has left in the spool and that have not been read yet. Any thread; one
// reads.
#pragma once

#include <chrono>
#include <cstddef>
#include <optional>
#include <vector>

#include "base/mutex.h"
#include "support/spool_folder.h"

namespace veltrad::backends {

class SpoolBacklog {
 public:
  using Name = support::SpoolFolder::Name;
  using Deadline = std::chrono::steady_clock::time_point;

  // True if the files are not listed yet; the caller then lists them and passes them to listed(), oldest
  // first, or nothing if they cannot be listed at the moment.
  bool isToBeListed();
  void listed(std::optional<std::vector<Name>> names);
  // True if all files have been listed and read.
  bool isDone() const;
  // The next file to read; absent if there is none now. The reader owns it until it calls wasRead(), with
  // false if the file must be read again.
  std::optional<Name> next();
  void wasRead(bool done);
  // Takes all files that were not read yet. Waits until listing and reading have ended. Absent if the files
  // are not listed, or the deadline passed first.
  std::optional<std::vector<Name>> takeAll(Deadline deadline);

 private:
  enum class State { unknown, beingListed, known };

  void forget() REQUIRES(_mutex);

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  State _state GUARDED_BY(_mutex) = State::unknown;
  bool _reads GUARDED_BY(_mutex) = false;
  int _takers GUARDED_BY(_mutex) = 0;  // that wait; nothing more is read before them
  std::vector<Name> _names GUARDED_BY(_mutex);
  std::size_t _next GUARDED_BY(_mutex) = 0;
};

}  // namespace veltrad::backends
