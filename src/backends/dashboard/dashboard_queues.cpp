// SPDX-License-Identifier: Apache-2.0
// Registers, finds and ends queues.
#include "backends/dashboard/dashboard_queues.h"

#include <algorithm>
#include <vector>

#include "backends/dashboard/network_proc_queue.h"

namespace veltrad::backends {

std::shared_ptr<NetworkProcQueue> DashboardQueues::join(const Route& route) {
  std::shared_ptr<NetworkProcQueue> queue;
  {
    const Lock held(_mutex);
    const auto found = _shared.find(route);
    if (found != _shared.end()) queue = found->second.lock();
    if (queue) forget(queue);
  }
  return queue && queue->join() ? queue : nullptr;
}

void DashboardQueues::share(const Route& route, const std::shared_ptr<NetworkProcQueue>& queue) {
  const Lock held(_mutex);
  std::erase_if(_shared, [](const auto& entry) { return entry.second.expired(); });
  _shared[route] = queue;
}

void DashboardQueues::lingers(const std::shared_ptr<NetworkProcQueue>& queue, std::int64_t user) {
  std::shared_ptr<NetworkProcQueue> leaves;
  {
    const Lock held(_mutex);
    forget(queue);
    _lingering.push_back({queue, user});
    leaves = takeOneTooMany(user);
  }
  if (leaves) leaves->end();
}

bool DashboardQueues::endOldest() {
  std::shared_ptr<NetworkProcQueue> leaves;
  {
    const Lock held(_mutex);
    forget(nullptr);
    if (_lingering.empty()) return false;
    leaves = _lingering.front().queue.lock();
    _lingering.pop_front();
  }
  if (leaves) leaves->end();
  return true;
}

void DashboardQueues::dropWaiting(const std::function<bool(const std::string& host)>& refuses) {
  std::vector<std::shared_ptr<NetworkProcQueue>> queues;
  {
    const Lock held(_mutex);
    for (const Lingering& one : _lingering) queues.push_back(one.queue.lock());
    for (const auto& [route, queue] : _shared) queues.push_back(queue.lock());
  }
  for (const auto& queue : queues) {
    if (queue && refuses(queue->host())) queue->dropWaiting();
  }
}

// Removes the queue, and those that have ended. Takes no reference, because releasing the last one under the
// lock would destroy a queue there.
void DashboardQueues::forget(const std::shared_ptr<NetworkProcQueue>& queue) {
  std::erase_if(_lingering, [&queue](const Lingering& one) {
    const bool same = !one.queue.owner_before(queue) && !queue.owner_before(one.queue);
    return same || one.queue.expired();
  });
}

std::shared_ptr<NetworkProcQueue> DashboardQueues::takeOneTooMany(std::int64_t user) {
  const auto own = [user](const Lingering& one) { return one.user == user; };
  auto oldest = _lingering.begin();
  if (std::count_if(_lingering.begin(), _lingering.end(), own) > static_cast<std::ptrdiff_t>(kMostOfUser)) {
    oldest = std::find_if(_lingering.begin(), _lingering.end(), own);
  } else if (_lingering.size() <= kMost) {
    return nullptr;
  }
  auto leaves = oldest->queue.lock();
  _lingering.erase(oldest);
  return leaves;
}

}  // namespace veltrad::backends
