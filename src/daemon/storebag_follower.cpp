// SPDX-License-Identifier: Apache-2.0
// Checks the storebags of open sessions once a second.
#include "daemon/storebag_follower.h"

#include <algorithm>
#include <new>

#include "daemon/veltrad_agent.h"
#include "platform/log.h"
#include "wire/constants.h"

namespace veltrad::daemon {

namespace {

// The minimum time between two fetches of one storebag; and the wait after a fetch that was no attempt,
// because of a shortage or because the owner forbids the server.
constexpr std::chrono::milliseconds kShortestCycle{900};
constexpr std::chrono::seconds kAfterNoAttempt{60};

}  // namespace

void StorebagFollower::tick(std::chrono::steady_clock::time_point now) {
  if (_agent.sessionCount() == 0) return;
  const auto choices = _choices.current();
  if (!choices || !choices->storebags.follow) return;
  const VeltradAgent::Followers followers = _agent.followers();
  std::erase_if(_followed, [&](const auto& one) { return !followers.contains(one.first); });
  for (const auto& [name, sessions] : followers) {
    const std::int32_t clientType =
        sessions.front().facts.sessionInfo->int32(wire::kVeltraSessionInfoClientType).value_or(0);
    const auto standing = _agent.storebags().standingForClientType(clientType);
    Followed& followed = _followed[name];
    if (!standing.known) continue;
    if (followed.told != standing.section) {
      followed.told = standing.section;
      for (const ListedSession& session : sessions) session.facts.aggregation->nudge();
    }
    if (!standing.due || now < followed.notBefore) continue;
    const bool noAttempt = followed.fetchTime == standing.fetchTime;
    followed.fetchTime = standing.fetchTime;
    followed.notBefore = now + (noAttempt ? kAfterNoAttempt : kShortestCycle);
    fetchSoon(name, clientType);
  }
}

void StorebagFollower::fetchSoon(const std::string& name, std::int32_t clientType) {
  constexpr std::size_t kStackBytes = 256u << 10;
  {
    const Lock held(_mutex);
    if (_stopped) return;
    _due[name] = clientType;
    _changed.notifyOne();
  }
  if (_thread.running() ||
      _thread.start("follower", std::max(kStackBytes, kConnectionStackBytes), [this] { fetch(); }))
    return;
  logWarning("Storebags are not fetched for open sessions just now: no thread can be started");
}

void StorebagFollower::fetch() {
  for (;;) {
    std::int32_t clientType = 0;
    {
      const Lock held(_mutex);
      while (_due.empty() && !_stopped) _changed.wait(_mutex);
      if (_stopped) return;
      clientType = _due.begin()->second;
      _due.erase(_due.begin());
    }
    try {
      static_cast<void>(_agent.storebags().storebagForClientType(clientType));
    } catch (const std::bad_alloc&) {
      logWarning("Storebags are not fetched for open sessions just now: no memory");
    }
  }
}

void StorebagFollower::stop() {
  {
    const Lock held(_mutex);
    _stopped = true;
    _changed.notifyOne();
  }
  _thread.join();
}

}  // namespace veltrad::daemon
