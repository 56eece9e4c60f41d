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

  // True: nobody lists the files yet, and the caller does, and says with listed() what there is, oldest
  // first; nothing: it cannot be told just now, so that somebody has to list them again.
  bool isToBeListed();
  void listed(std::optional<std::vector<Name>> names);
  // All have been listed and read.
  bool isDone() const;
  // The next to be read; nothing: there is none now. It is the reader's until it calls wasRead(), with false
  // if it has to be read again.
  std::optional<Name> next();
  void wasRead(bool done);
  // All that has not been read, which is the caller's from then on. Waits for what is being listed and read.
  // Nothing: it is not known what there is, or the deadline passed first.
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
