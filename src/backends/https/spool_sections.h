// SPDX-License-Identifier: Apache-2.0
// The storebag sections of kept posts. Storebags are fetched on a separate thread, so that neither a try nor
// a withdrawal of consent waits for a server. Any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>

#include "base/mutex.h"
#include "base/thread.h"
#include "config/storebag_content.h"

namespace veltrad::backends {

class SectionSource {
 public:
  virtual ~SectionSource() = default;
  // The section for a client type; null: there is none. `fetch`: as for a session, which may wait for a
  // download; else only what is known.
  virtual std::shared_ptr<const config::StorebagSection> sectionFor(std::int32_t clientType, bool fetch) = 0;
};

class SpoolSections {
 public:
  using Time = std::chrono::steady_clock::time_point;
  // The minimum time between fetches, because each failed one is logged.
  static constexpr std::chrono::seconds kApart{30};

  ~SpoolSections() { stop(); }

  // Before another thread asks. `source` must outlive it; `ended` is called when a fetch has ended.
  void setSource(SectionSource& source, std::function<void()> ended);
  // Null: none is known.
  std::shared_ptr<const config::StorebagSection> known(std::int32_t clientType) const;
  // Fetches the storebag unless that was done recently. True while it is being fetched, or if no thread could
  // be started for it. Used by one thread.
  bool isAwaited(std::int32_t clientType, Time now = std::chrono::steady_clock::now());
  // Grows when a client type's first fetch has ended, and when one has brought another section.
  std::uint64_t turn() const;
  // Nothing is fetched any more. Waits for a fetch, which the HTTP client should have made fail.
  void stop();

 private:
  struct Asked {
    Time when;
    bool awaited = true;
    bool fetched = false;  // at least once
    std::shared_ptr<const config::StorebagSection> section;
  };
  void run();

  // Constant once other threads ask.
  SectionSource* _source = nullptr;
  std::function<void()> _fetched;

  // Of the thread that asks.
  Thread _thread;

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _news;
  // By client type. A post that names none has one, too.
  std::map<std::int32_t, Asked> _asked GUARDED_BY(_mutex);
  std::uint64_t _turn GUARDED_BY(_mutex) = 0;
  bool _stops GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::backends
