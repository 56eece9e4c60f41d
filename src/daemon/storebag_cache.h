// SPDX-License-Identifier: Apache-2.0
// The storebags that the daemon has downloaded, one record per name. Any thread.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "backends/https/spool_sections.h"
#include "config/storebag_content.h"
#include "config/storebag_source.h"
#include "daemon/lock_ranks.h"
#include "daemon/storebag_age.h"
#include "platform/clock.h"

namespace veltrad::daemon {

// Made at the first fetch for its name, never removed.
struct StorebagRecord : StorebagAge {
  // The section that was obtained last. Failures do not remove it.
  std::shared_ptr<const config::StorebagSection> data;
  std::optional<std::string> version;
  std::optional<std::string> lastModified;
  // Why the last attempt's storebag was refused by a rule of the operator; empty: it was not.
  std::string refusal;
  std::optional<wire::Reason> refusalReason;
  // It was logged that the section may no longer be used.
  bool saidUnused = false;
  // The section that an earlier daemon has kept was read.
  bool recalled = false;
  // Requests for this name wait.
  bool beingFetched = false;
};

class StorebagCache final : public backends::SectionSource {
 public:
  // Both must outlive it.
  StorebagCache(config::StorebagSource& source, const platform::Clock& clock)
      : _source(source), _clock(clock) {}

  // The section for the client type, or null. May wait for a download for the same name, without the lock.
  std::shared_ptr<const config::StorebagSection> storebagForClientType(std::int32_t clientType);
  // The same for the spool; with `fetch` false, what the record holds.
  std::shared_ptr<const config::StorebagSection> sectionFor(std::int32_t clientType, bool fetch) override;
  // Fetches the storebag of a client type that has one, unconditionally and whatever its record is, and takes
  // the answer into the record as usual. May wait as above, and then for the server.
  config::StorebagAnswer refresh(std::int32_t clientType);
  std::optional<std::string> versionForClientType(std::int32_t clientType);
  // The section that a session of the client type would get without a download.
  struct Standing {
    bool known = false;                                      // a section was fetched
    std::shared_ptr<const config::StorebagSection> section;  // null: none that may be used
    std::optional<std::string> version;
    bool due = false;  // a download is
    double fetchTime = 0;
  };
  Standing standingForClientType(std::int32_t clientType);
  // The rule because of which no section can be used; absent if there is a section, or if the reason is
  // another.
  std::optional<wire::Reason> refusalForClientType(std::int32_t clientType);
  // By name; a record being fetched is as its last attempt left it.
  std::map<std::string, StorebagRecord> records();
  // The operator's, from 0 to 1.
  double jitter() { return _source.jitter(); }

 private:
  config::StorebagSectionAnswer fetched(std::int32_t clientType, const char* name,
                                        const std::optional<std::string>& lastModified) EXCLUDES(_lock);
  // Called at the first use of a name: takes over what an earlier daemon has kept of it.
  void recall(std::int32_t clientType, const std::string& name);
  // Called when the fetch of a record has ended.
  void settle(StorebagRecord& record) REQUIRES(_lock);
  // Waits until the record of this name is not being fetched.
  StorebagRecord& settledRecord(const std::string& name) REQUIRES(_lock);
  CacheVerdict verdictOf(const StorebagRecord& record) const;
  // The record's section, if it may still be used.
  std::shared_ptr<const config::StorebagSection> used(StorebagRecord& record) const REQUIRES(_lock);
  // Takes an answer into the record and returns what the session gets.
  std::shared_ptr<const config::StorebagSection> taken(std::int32_t clientType, StorebagRecord& record,
                                                       config::StorebagSectionAnswer answer) REQUIRES(_lock);

  config::StorebagSource& _source;
  const platform::Clock& _clock;

  Mutex _lock STOREBAG_CACHE_LOCK;
  Condition _fetched;
  std::map<std::string, StorebagRecord> _cachedStorebags GUARDED_BY(_lock);
};

}  // namespace veltrad::daemon
