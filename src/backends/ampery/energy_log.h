// The energy log: registered events, one JSON object a line. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/value.h"

namespace veltrad::platform {
class Clock;
class Counters;
}  // namespace veltrad::platform

namespace veltrad::backends {

// A line is {"client": n, "name": text, "time": seconds since 1970, "event": {…}} and goes to the end of the
// file in one write. The file is opened anew for each line, so that one that was renamed or removed is
// followed by a new one (mode 0640). A link in its place is not followed.
class EnergyLog {
 public:
  // Clock and counters outlive it. The directory must be there.
  EnergyLog(const platform::Clock& clock, platform::Counters& counters, std::string path)
      : _clock(clock), _counters(counters), _path(std::move(path)) {}

  // An event that cannot be written is lost and counted; one error line for an episode of failures says so.
  void logRegisteredEvent(std::uint32_t client, const std::string& name, const Dictionary& event);

 private:
  // Nothing, or the failure text.
  std::optional<std::string> append(std::string_view line) const REQUIRES(_mutex);

  // Constant after construction.
  const platform::Clock& _clock;
  platform::Counters& _counters;
  const std::string _path;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::uint64_t _lost GUARDED_BY(_mutex) = 0;  // in this episode
};

}  // namespace veltrad::backends
