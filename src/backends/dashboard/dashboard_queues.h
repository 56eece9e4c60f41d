// SPDX-License-Identifier: Apache-2.0
// The queues to dashboards that outlive their back ends: limits their number, and finds those that one-shot
// messages share. Any thread.
#pragma once

#include <netinet/in.h>

#include <chrono>
#include <compare>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <list>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "base/mutex.h"
#include "platform/memory_budget.h"

namespace veltrad::backends {

class NetworkProcQueue;

// One object serves all dashboard back ends. It does not own the queues: a queue ends when nothing waits in
// it, which is noticed here at the next call. It calls no queue under its own lock.
class DashboardQueues {
 public:
  static constexpr std::size_t kMostOfUser = 64;
  static constexpr std::size_t kMost = 256;
  // For one-shot messages on one route.
  static constexpr std::size_t kMostShared = 16;
  // Stands for an unknown user.
  static constexpr std::int64_t kNobody = -1;

  static std::int64_t userOf(const platform::MemoryAccount* account) {
    return account ? std::int64_t{account->uid()} : kNobody;
  }

  // The key by which one-shot messages share a queue.
  struct Route {
    in_addr_t address = 0;
    in_port_t port = 0;
    bool reliable = false;
    std::chrono::milliseconds period{};
    std::int64_t user = kNobody;
    auto operator<=>(const Route&) const = default;
  };

  // Returns a queue for a one-shot message on this route, to which one more back end is then connected: one
  // that awaits no acknowledgement, because all one-shot messages have the same number. Null if there is none
  // and a new queue may be made; at the bound, the least recently joined queue.
  std::shared_ptr<NetworkProcQueue> join(const Route& route);
  // From now on join() finds this queue, too.
  void share(const Route& route, const std::shared_ptr<NetworkProcQueue>& queue);
  // Registers a queue that waits without a back end. If the user, or all together, have too many such queues,
  // the oldest one is ended.
  void lingers(const std::shared_ptr<NetworkProcQueue>& queue, std::int64_t user);
  // Frees a descriptor. False if no queue lingers.
  bool endOldest();
  // Drops the datagrams of lingering and shared queues whose host `refuses` rejects.
  void dropWaiting(const std::function<bool(const std::string& host)>& refuses);

 private:
  struct Lingering {
    std::weak_ptr<NetworkProcQueue> queue;
    std::int64_t user;
  };
  void forget(const std::shared_ptr<NetworkProcQueue>& queue) REQUIRES(_mutex);
  // The active queues on this route, the least recently joined first.
  std::vector<std::shared_ptr<NetworkProcQueue>> sharedOn(const Route& route);
  // This one was joined.
  void joined(const Route& route, const std::shared_ptr<NetworkProcQueue>& queue);
  // Removes the oldest queue of the user, or of all, if there are too many. Null if there is room.
  std::shared_ptr<NetworkProcQueue> takeOneTooMany(std::int64_t user) REQUIRES(_mutex);

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  // Oldest first.
  std::list<Lingering> _lingering GUARDED_BY(_mutex);
  // The one that was joined longest ago first.
  std::map<Route, std::list<std::weak_ptr<NetworkProcQueue>>> _shared GUARDED_BY(_mutex);
};

}  // namespace veltrad::backends
