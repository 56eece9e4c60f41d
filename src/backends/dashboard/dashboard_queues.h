// The queues to dashboards that outlive their back ends: how many may linger, and which of them one-shot
// messages find again. Any thread.
#pragma once

#include <netinet/in.h>

#include <chrono>
#include <compare>
#include <cstddef>
#include <cstdint>
#include <list>
#include <map>
#include <memory>

#include "base/mutex.h"

namespace veltrad::backends {

class NetworkProcQueue;

// One for all dashboard back ends. It owns no queue: a queue ends by itself when nothing waits in it, which
// is noticed here at the next look. No queue's lock is taken under its own.
class DashboardQueues {
 public:
  static constexpr std::size_t kMostOfUser = 64;
  static constexpr std::size_t kMost = 256;
  static constexpr std::int64_t kNobody = -1;  // where no user is known

  // Where one-shot messages of one user go in the same way.
  struct Route {
    in_addr_t address = 0;
    in_port_t port = 0;
    bool reliable = false;
    std::chrono::milliseconds period{};
    std::int64_t user = kNobody;
    auto operator<=>(const Route&) const = default;
  };

  // The queue that one-shot messages on this route share, with one back end more to wait for; null: there is
  // none.
  std::shared_ptr<NetworkProcQueue> join(const Route& route);
  // From now on join() finds it.
  void share(const Route& route, const std::shared_ptr<NetworkProcQueue>& queue);
  // `queue` waits without a back end. Beyond the bounds the oldest such one of its user is ended, else the
  // oldest of all.
  void lingers(const std::shared_ptr<NetworkProcQueue>& queue, std::int64_t user);
  // For want of a descriptor; false: none lingers.
  bool endOldest();

 private:
  struct Lingering {
    std::weak_ptr<NetworkProcQueue> queue;
    std::int64_t user;
  };
  using List = std::list<Lingering>;
  void forget(const std::shared_ptr<NetworkProcQueue>& queue) REQUIRES(_mutex);
  // Of `user`'s, where there are too many of them, else of all; null: there is room.
  std::shared_ptr<NetworkProcQueue> takeOneTooMany(std::int64_t user) REQUIRES(_mutex);

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  List _lingering GUARDED_BY(_mutex);  // oldest first
  std::map<Route, std::weak_ptr<NetworkProcQueue>> _shared GUARDED_BY(_mutex);
};

}  // namespace veltrad::backends
