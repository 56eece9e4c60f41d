// When to download, and what a download leaves in the cache.
#include "daemon/storebag_cache.h"

#include <cmath>

#include "config/client_types.h"
#include "config/storebag_content.h"
#include "config/storebag_source.h"
#include "platform/clock.h"
#include "platform/log.h"

namespace veltrad::daemon {

CacheVerdict verdictOfRecord(const StorebagRecord& record, double now) {
  if (!record.attempted) return CacheVerdict::fetch;
  const double age = std::abs(now - record.fetchTime);
  if (record.fetchSuccessful) return age < record.maxAge ? CacheVerdict::serve : CacheVerdict::fetch;
  return age < kSecondsBetweenAttempts ? CacheVerdict::wait : CacheVerdict::fetch;
}

std::shared_ptr<const config::StorebagSection> StorebagCache::storebagForClientType(std::int32_t clientType,
                                                                                    RecursiveMutex& lock) {
  const char* name = config::storebagNameForClientType(clientType);
  if (!name) return fetchAndCacheStorebag(clientType, nullptr, lock);
  for (;;) {
    const auto at = _cachedStorebags.find(name);
    if (at == _cachedStorebags.end()) break;
    if (at->second.beingFetched) {
      _fetched.wait(lock);
      continue;
    }
    const CacheVerdict verdict = verdictOfRecord(at->second, platform::timevalToSeconds(_clock.now()));
    if (verdict == CacheVerdict::serve) {
      logDebug("storebagForSession: Cached storebag found for client type %d", clientType);
      return at->second.data;
    }
    if (verdict == CacheVerdict::wait) {
      logInfo(
          "storebagForSession: Not fetching storebag for client type %d - must wait %d seconds between "
          "attempts",
          clientType, kSecondsBetweenAttempts);
      return at->second.data;
    }
    break;
  }
  return fetchAndCacheStorebag(clientType, name, lock);
}

std::optional<std::string> StorebagCache::versionForClientType(std::int32_t clientType) const {
  const char* name = config::storebagNameForClientType(clientType);
  const auto at = name ? _cachedStorebags.find(name) : _cachedStorebags.end();
  return at == _cachedStorebags.end() ? std::nullopt : at->second.version;
}

std::shared_ptr<const config::StorebagSection> StorebagCache::fetchAndCacheStorebag(std::int32_t clientType,
                                                                                    const char* name,
                                                                                    RecursiveMutex& lock) {
  logDebug("fetchAndCacheStorebag: Fetching storebag for client type %d", clientType);
  if (!name) {
    static_cast<void>(_source.fetchStorebagForEnvironmentAndClientType(clientType, std::nullopt));
    return nullptr;
  }
  const std::optional<std::string> lastModified = _cachedStorebags[name].lastModified;
  _cachedStorebags[name].beingFetched = true;
  lock.unlock();
  auto answer = _source.fetchStorebagForEnvironmentAndClientType(clientType, lastModified);
  lock.lock();

  using Kind = config::StorebagAnswer::Kind;
  StorebagRecord& record = _cachedStorebags[name];
  record.beingFetched = false;
  _fetched.notifyAll();
  if (!answer.attempted) {
    logInfo(
        "fetchAndCacheStorebag: No attempt for client type %d: the daemon is short of something, or stopping",
        clientType);
    return record.data || answer.kind != Kind::fetched ? record.data : answer.section;
  }
  logDebug("fetchAndCacheStorebag: Storebag max age: %d seconds", answer.maxAge);
  record.fetchSuccessful = answer.kind != Kind::failed;
  if (answer.kind == Kind::fetched) {
    record.data = std::move(answer.section);
    record.version = std::move(answer.version);
  } else if (answer.kind == Kind::failed) {
    logError("fetchAndCacheStorebag: Unable to fetch storebag for client type %d", clientType);
  }
  record.fetchTime = platform::timevalToSeconds(_clock.now());
  record.maxAge = answer.maxAge;
  if (answer.lastModified) record.lastModified = std::move(answer.lastModified);
  record.attempted = true;
  return record.data;
}

}  // namespace veltrad::daemon
