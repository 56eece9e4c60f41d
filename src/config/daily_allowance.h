// SPDX-License-Identifier: Apache-2.0
// Counts the events and bytes that left the device today, for the owner's daily limits. Any thread.
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

// Days are in UTC. The counts survive a restart in a file {"day": days since 1970, "events": n, "bytes": n};
// an invalid file counts as a new day. Counts also without limits, so that a limit that is set at noon
// includes the morning.
class DailyAllowance {
 public:
  // The constructor's arguments must outlive it.
  DailyAllowance(platform::FileStore& files, const platform::Clock& clock, std::string path)
      : _files(files), _clock(clock), _path(std::move(path)) {}

  // Counts there from now on, and goes on from what stands there, which must outlive it and the process. To
  // be called before anything is counted and before another thread exists.
  void countIn(platform::DayAccount& account);
  // Reads the counts from before the start. After a shortage call it again, until it succeeds.
  void load();
  // False, and nothing is counted, if this would exceed a limit, or if there is a limit and the file has not
  // been read yet.
  bool take(const PolicyRules& rules, std::uint64_t events, std::uint64_t bytes);
  // Returns an amount that was taken and not used.
  void giveBack(std::uint64_t events, std::uint64_t bytes);
  // The content for the file, and its version.
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
