// SPDX-License-Identifier: Apache-2.0
// Decides when to download, and takes the result into the cache.
#include "daemon/storebag_cache.h"

#include <cmath>
#include <new>

#include "config/client_types.h"
#include "platform/log.h"
#include "platform/random.h"

namespace veltrad::daemon {

CacheVerdict StorebagCache::verdictOf(const StorebagRecord& record) const {
  return verdictOfAge(record, platform::timevalToSeconds(_clock.now()), _source.jitter());
}

std::shared_ptr<const config::StorebagSection> StorebagCache::storebagForClientType(std::int32_t clientType) {
  const char* name = config::storebagNameForClientType(clientType);
  std::optional<std::string> lastModified;
  if (name) recall(clientType, name);
  if (name) {
    const Lock held(_lock);
    StorebagRecord& record = settledRecord(name);
    auto section = used(record);
    const CacheVerdict verdict = verdictOf(record);
    // A fresh storebag that has expired is fetched again.
    if (verdict == CacheVerdict::serve && (section || !record.data)) {
      logDebug("storebagForSession: Cached storebag found for client type %d", clientType);
      return section;
    }
    if (verdict == CacheVerdict::wait) {
      logInfo(
          "storebagForSession: Not fetching storebag for client type %d - must wait %d seconds between "
          "attempts",
          clientType, static_cast<int>(std::ceil(record.wait(_source.jitter()))));
      return section;
    }
    // A section that may not be used must be replaced by a complete answer, so the request is unconditional.
    if (section || !record.data) lastModified = record.lastModified;
    record.beingFetched = true;
  }
  config::StorebagSectionAnswer answer = fetched(clientType, name, lastModified);
  if (!name) return nullptr;
  const Lock held(_lock);
  return taken(clientType, _cachedStorebags[name], std::move(answer));
}

std::shared_ptr<const config::StorebagSection> StorebagCache::sectionFor(std::int32_t clientType,
                                                                         bool fetch) {
  if (fetch) return storebagForClientType(clientType);
  const char* name = config::storebagNameForClientType(clientType);
  const Lock held(_lock);
  const auto at = name ? _cachedStorebags.find(name) : _cachedStorebags.end();
  return at == _cachedStorebags.end() ? nullptr : used(at->second);
}

config::StorebagAnswer StorebagCache::refresh(std::int32_t clientType) {
  const char* name = config::storebagNameForClientType(clientType);
  recall(clientType, name);
  {
    const Lock held(_lock);
    settledRecord(name).beingFetched = true;
  }
  config::StorebagSectionAnswer answer = fetched(clientType, name, std::nullopt);
  const Lock held(_lock);
  settle(_cachedStorebags[name]);  // first, because the copy may find no memory
  config::StorebagAnswer told = answer;
  taken(clientType, _cachedStorebags[name], std::move(answer));
  return told;
}

// The record, where there is one, is marked as being fetched.
config::StorebagSectionAnswer StorebagCache::fetched(std::int32_t clientType, const char* name,
                                                     const std::optional<std::string>& lastModified) {
  logDebug("fetchAndCacheStorebag: Fetching storebag for client type %d", clientType);
  try {
    return _source.fetchStorebagForEnvironmentAndClientType(clientType, lastModified);
  } catch (const std::bad_alloc&) {
    const Lock held(_lock);
    if (name) settle(_cachedStorebags[name]);
    throw;
  }
}

StorebagCache::Standing StorebagCache::standingForClientType(std::int32_t clientType) {
  const char* name = config::storebagNameForClientType(clientType);
  const Lock held(_lock);
  const auto at = name ? _cachedStorebags.find(name) : _cachedStorebags.end();
  if (at == _cachedStorebags.end()) return {};
  StorebagRecord& record = at->second;
  const CacheVerdict verdict = verdictOf(record);
  auto section = used(record);
  const bool unused = verdict == CacheVerdict::serve && record.data && !section;
  return {record.data != nullptr, std::move(section), record.version,
          !record.beingFetched && (verdict == CacheVerdict::fetch || unused), record.fetchTime};
}

std::optional<wire::Reason> StorebagCache::refusalForClientType(std::int32_t clientType) {
  const char* name = config::storebagNameForClientType(clientType);
  const Lock held(_lock);
  const auto at = name ? _cachedStorebags.find(name) : _cachedStorebags.end();
  if (at == _cachedStorebags.end() || used(at->second)) return std::nullopt;
  return at->second.data ? wire::Reason::storebag_expired : at->second.refusalReason;
}

std::optional<std::string> StorebagCache::versionForClientType(std::int32_t clientType) {
  const char* name = config::storebagNameForClientType(clientType);
  const Lock held(_lock);
  const auto at = name ? _cachedStorebags.find(name) : _cachedStorebags.end();
  return at == _cachedStorebags.end() ? std::nullopt : at->second.version;
}

void StorebagCache::recall(std::int32_t clientType, const std::string& name) {
  {
    const Lock held(_lock);
    StorebagRecord& record = settledRecord(name);
    if (record.attempted || record.recalled) return;
    record.beingFetched = true;
  }
  config::KeptSection kept;
  try {
    kept = _source.keptStorebag(clientType);
  } catch (const std::bad_alloc&) {
    const Lock held(_lock);
    settle(_cachedStorebags[name]);
    throw;
  }
  const Lock held(_lock);
  StorebagRecord& record = _cachedStorebags[name];
  settle(record);
  record.recalled = kept.known;
  if (!kept.answer.section) return;
  logInfo("storebagForSession: Storebag '%s' is the one that was kept before the start", name.c_str());
  record.data = std::move(kept.answer.section);
  record.version = std::move(kept.answer.version);
  record.ended(true, kept.answer.maxAge, kept.fetchTime, platform::kernelUniform());
  record.lastModified = std::move(kept.answer.lastModified);
}

std::map<std::string, StorebagRecord> StorebagCache::records() {
  const Lock held(_lock);
  return _cachedStorebags;
}

void StorebagCache::settle(StorebagRecord& record) {
  record.beingFetched = false;
  _fetched.notifyAll();
}

StorebagRecord& StorebagCache::settledRecord(const std::string& name) {
  StorebagRecord& record = _cachedStorebags[name];
  while (record.beingFetched) _fetched.wait(_lock);
  return record;
}

std::shared_ptr<const config::StorebagSection> StorebagCache::used(StorebagRecord& record) const {
  const auto why = record.data ? _source.whyNotUsed(*record.data) : std::nullopt;
  if (why && !record.saidUnused)
    logError("Storebag '%s' refused: %s", record.data->origin.name.c_str(), why->c_str());
  record.saidUnused = why.has_value();
  return why ? nullptr : record.data;
}

std::shared_ptr<const config::StorebagSection> StorebagCache::taken(std::int32_t clientType,
                                                                    StorebagRecord& record,
                                                                    config::StorebagSectionAnswer answer) {
  using Kind = config::StorebagAnswer::Kind;
  settle(record);
  if (!answer.attempted) {
    logInfo(
        "fetchAndCacheStorebag: No attempt for client type %d: the daemon is short of something, or stopping",
        clientType);
    return record.data || answer.kind != Kind::fetched ? used(record) : answer.section;
  }
  logDebug("fetchAndCacheStorebag: Storebag max age: %d seconds", answer.maxAge);
  record.ended(answer.kind != Kind::failed, answer.maxAge, platform::timevalToSeconds(_clock.now()),
               platform::kernelUniform());
  if (answer.kind == Kind::fetched) {
    record.data = std::move(answer.section);
    record.version = std::move(answer.version);
  } else if (answer.kind == Kind::failed) {
    logError("fetchAndCacheStorebag: Unable to fetch storebag for client type %d", clientType);
  }
  if (answer.lastModified) record.lastModified = std::move(answer.lastModified);
  record.refusalReason = answer.refusal;
  record.refusal = answer.refusal ? std::move(answer.why) : std::string();
  return used(record);
}

}  // namespace veltrad::daemon
