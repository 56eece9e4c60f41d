// The storebags that the daemon holds, one record a name. Any thread.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "daemon/lock_ranks.h"

namespace veltrad::config {
class StorebagSource;
struct StorebagSection;
struct StorebagSectionAnswer;
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
  bool recalled = false;                    // what an earlier daemon kept was looked at
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

  // The section for the client type, or null. May wait for an exchange with the server, its own or another's
  // for the same name, without the lock.
  std::shared_ptr<const config::StorebagSection> storebagForClientType(std::int32_t clientType);
  std::optional<std::string> versionForClientType(std::int32_t clientType);

 private:
  // At the first use of a name: the record as an earlier daemon has kept it.
  void recall(std::int32_t clientType, const std::string& name);
  // Nobody fetches it any more.
  void settle(StorebagRecord& record) REQUIRES(_lock);
  // The record of this name, once nobody fetches it.
  StorebagRecord& settledRecord(const std::string& name) REQUIRES(_lock);
  // What the session gets.
  std::shared_ptr<const config::StorebagSection> taken(std::int32_t clientType, StorebagRecord& record,
                                                       config::StorebagSectionAnswer answer) REQUIRES(_lock);

  config::StorebagSource& _source;
  const platform::Clock& _clock;

  Mutex _lock STOREBAG_CACHE_LOCK;
  Condition _fetched;
  std::map<std::string, StorebagRecord> _cachedStorebags GUARDED_BY(_lock);
};

}  // namespace veltrad::daemon
