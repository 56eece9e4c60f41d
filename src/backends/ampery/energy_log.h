// SPDX-License-Identifier: Apache-2.0
// The energy log: registered events, one JSON object per line. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/value.h"
#include "platform/clock.h"
#include "platform/counters.h"

namespace veltrad::backends {

// Each line is {"client": n, "name": text, "time": seconds since 1970, "event": {…}}, appended in one write.
// The file is opened for each line, so a file that was renamed or removed is replaced by a new one (mode
// 0640). Symbolic links are not followed.
class EnergyLog {
 public:
  // The clock and the counters must outlive it. The directory must exist.
  EnergyLog(const platform::Clock& clock, platform::Counters& counters, std::string path)
      : _clock(clock), _counters(counters), _path(std::move(path)) {}

  // False, and counted as lost, if the event cannot be written. Consecutive failures make one error line.
  bool logRegisteredEvent(std::uint32_t client, const std::string& name, const Dictionary& event);

 private:
  // Returns why it failed, if it did.
  std::optional<std::string> append(std::string_view line) const REQUIRES(_mutex);

  const platform::Clock& _clock;
  platform::Counters& _counters;
  const std::string _path;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  // Since the last event that was written.
  std::uint64_t _lost GUARDED_BY(_mutex) = 0;
};

}  // namespace veltrad::backends
