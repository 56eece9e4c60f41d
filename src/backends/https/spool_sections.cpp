// SPDX-License-Identifier: Apache-2.0
// Fetches the storebags of kept posts, one after the other.
#include "backends/https/spool_sections.h"

#include <algorithm>
#include <new>
#include <utility>

#include "platform/log.h"

namespace veltrad::backends {

void SpoolSections::setSource(SectionSource& source, std::function<void()> ended) {
  _source = &source;
  _fetched = std::move(ended);
}

std::shared_ptr<const config::StorebagSection> SpoolSections::known(std::int32_t clientType) const {
  return _source ? _source->sectionFor(clientType, false) : nullptr;
}

bool SpoolSections::isAwaited(std::int32_t clientType, Time now) {
  constexpr std::size_t kStackBytes = 256u << 10;
  if (!_source) return false;
  {
    const Lock held(_mutex);
    if (_stops) return true;
    const auto [asked, isNew] = _asked.try_emplace(clientType, Asked{now, true, false, nullptr});
    Asked& one = asked->second;
    if (!isNew && !one.awaited && one.when + kApart <= now) {
      one.when = now;
      one.awaited = true;
    }
    if (!one.awaited) return false;
    _news.notifyOne();
  }
  if (!_thread.running() &&
      !_thread.start("spool-bags", std::max(kStackBytes, kConnectionStackBytes), [this] { run(); }))
    logDebug("No thread can be started to fetch the storebags of kept posts, which wait");
  return true;
}

std::uint64_t SpoolSections::turn() const {
  const Lock held(_mutex);
  return _turn;
}

void SpoolSections::run() {
  for (;;) {
    std::int32_t clientType = 0;
    {
      const Lock held(_mutex);
      const auto isAwaited = [](const auto& one) { return one.second.awaited; };
      auto next = _asked.end();
      while (!_stops && (next = std::find_if(_asked.begin(), _asked.end(), isAwaited)) == _asked.end())
        _news.wait(_mutex);
      if (_stops) return;
      clientType = next->first;
    }
    std::shared_ptr<const config::StorebagSection> section;
    try {
      section = _source->sectionFor(clientType, true);
    } catch (const std::bad_alloc&) {
      logWarning("The storebag of kept posts is not fetched just now: no memory");
    }
    {
      const Lock held(_mutex);
      Asked& asked = _asked[clientType];
      asked.awaited = false;
      if (!std::exchange(asked.fetched, true) || asked.section != section) ++_turn;
      asked.section = std::move(section);
    }
    _fetched();
  }
}

void SpoolSections::stop() {
  {
    const Lock held(_mutex);
    _stops = true;
    _news.notifyOne();
  }
  _thread.join();
}

}  // namespace veltrad::backends
