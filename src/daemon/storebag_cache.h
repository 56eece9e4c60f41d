// The storebags that the daemon holds, one record a name. Under the agent's lock, which is let go for the
// exchange with the server alone.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "base/mutex.h"

namespace veltrad::config {
class StorebagSource;
struct StorebagSection;
}  // namespace veltrad::config

namespace veltrad::platform {
class Clock;
}  // namespace veltrad::platform

namespace veltrad::daemon {

// What is kept of one storebag. Made at the first fetch for its name, never removed.
struct StorebagRecord {
  std::shared_ptr<const config::StorebagSection>
      data;                            // "StorebagData": the section last obtained; kept through failures
  std::optional<std::string> version;  // "StorebagVersion"
  double fetchTime = 0;                // "StorebagFetchTime": when the last attempt ended, seconds since 1970
  bool fetchSuccessful = false;        // "StorebagFetchState": "Fetch Successful" or "Fetch Failure"
  std::int32_t maxAge = 0;             // "StorebagMaxAge", seconds
  std::optional<std::string> lastModified;  // "StorebagLastModified"
  bool attempted = false;                   // a first attempt has ended
  bool beingFetched = false;                // requests for this name wait and look again
};

enum class CacheVerdict { serve, wait, fetch };
// Whether a record serves at this time: fresh; failed less than 900 s ago; or neither. The age is absolute,
// so a clock that was set back makes a record old, too.
CacheVerdict verdictOfRecord(const StorebagRecord& record, double now);

inline constexpr int kSecondsBetweenAttempts = 900;

class StorebagCache {
 public:
  // Both outlive it.
  StorebagCache(config::StorebagSource& source, const platform::Clock& clock)
      : _source(source), _clock(clock) {}

  // `lock` is the agent's, held by every caller. The section for the client type, or null: may wait for an
  // exchange, with the lock let go, so the lock is held exactly once when it is called.
  std::shared_ptr<const config::StorebagSection> storebagForClientType(std::int32_t clientType,
                                                                       RecursiveMutex& lock) REQUIRES(lock);
  std::optional<std::string> versionForClientType(std::int32_t clientType) const;

 private:
  // What the session gets.
  std::shared_ptr<const config::StorebagSection> fetchAndCacheStorebag(std::int32_t clientType,
                                                                       const char* name, RecursiveMutex& lock)
      REQUIRES(lock);

  config::StorebagSource& _source;
  const platform::Clock& _clock;
  RecursiveCondition _fetched;
  std::map<std::string, StorebagRecord> _cachedStorebags;
};

}  // namespace veltrad::daemon
