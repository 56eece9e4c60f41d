// SPDX-License-Identifier: Apache-2.0
// Counts what has left the device today, against the owner's limits. Any thread.
#pragma once

#include <cstdint>
#include <string>

#include "base/mutex.h"
#include "config/policy.h"
#include "platform/counters.h"

namespace veltrad::platform {
class Clock;
class FileStore;
}  // namespace veltrad::platform

namespace veltrad::config {

// A day is one of UTC. Kept over a restart in {"day": days since 1970, "events": n, "bytes": n}; a file that
// holds nothing of this kind counts as a new day. Counts while no limit holds, too, so that one which is set
// at noon covers the morning.
class DailyAllowance {
 public:
  // What the constructor takes outlives it.
  DailyAllowance(platform::FileStore& files, const platform::Clock& clock, std::string path)
      : _files(files), _clock(clock), _path(std::move(path)) {}

  // Counts there from now on, and goes on from what stands there, which outlives it and the process. To be
  // called before anything is counted and before another thread exists.
  void countIn(platform::DayAccount& account);
  // Reads what was counted before the start. A shortage passes: to be called again until it has been read.
  void load();
  // False, and nothing is counted, if this would go beyond a limit, or if there is one and the file has not
  // been read yet.
  bool take(const PolicyRules& rules, std::uint64_t events, std::uint64_t bytes);
  // What was taken a moment ago is not used.
  void giveBack(std::uint64_t events, std::uint64_t bytes);
  // What the file is to hold, and numbers that differ where that differs.
  std::string text() const;
  std::uint64_t version() const;

 private:
  void beginDay() REQUIRES(_mutex);

  platform::FileStore& _files;
  const platform::Clock& _clock;
  const std::string _path;

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  bool _loaded GUARDED_BY(_mutex) = false;
  platform::DayAccount _own GUARDED_BY(_mutex);
  platform::DayAccount* _account GUARDED_BY(_mutex) = &_own;
  platform::DayAccount _before GUARDED_BY(_mutex);  // what stood in the account at first
  std::uint64_t _version GUARDED_BY(_mutex) = 0;
};

}  // namespace veltrad::config
