// SPDX-License-Identifier: Apache-2.0
// Updates open sessions when their storebags change, if the operator has chosen so ("openSessions").
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "base/mutex.h"
#include "base/thread.h"
#include "config/operator_settings.h"
#include "config/storebag_content.h"

namespace veltrad::daemon {

class VeltradAgent;

// Fetches the storebags of open sessions when their refresh cycles are over, on a thread of its own that
// exists from the first such fetch on, and nudges the sessions of a storebag that has changed or may no
// longer be used. The main thread calls tick() and stop(). The constructor's arguments must outlive it.
class StorebagFollower {
 public:
  StorebagFollower(VeltradAgent& agent, config::OperatorSettings& choices)
      : _agent(agent), _choices(choices) {}
  ~StorebagFollower() { stop(); }

  // About once a second.
  void tick(std::chrono::steady_clock::time_point now = std::chrono::steady_clock::now());
  // After the HTTP client fails waits, so that a fetch does not hold it up.
  void stop();

 private:
  struct Followed {
    // The section for which the sessions were nudged last, null if none may be used; absent if they were not
    // nudged.
    std::optional<std::shared_ptr<const config::StorebagSection>> told;
    std::optional<double> fetchTime;                  // of the record when the last fetch was asked for
    std::chrono::steady_clock::time_point notBefore;  // for the next fetch
  };
  void fetchSoon(const std::string& name, std::int32_t clientType);
  void fetch();

  VeltradAgent& _agent;
  config::OperatorSettings& _choices;

  // The main thread only.
  std::map<std::string, Followed> _followed;  // by the name of the storebag
  Thread _thread;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::map<std::string, std::int32_t> _due GUARDED_BY(_mutex);  // a client type by the name of its storebag
  bool _stopped GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::daemon
