// SPDX-License-Identifier: Apache-2.0
// Registers, finds and ends queues.
#include "backends/dashboard/dashboard_queues.h"

#include <algorithm>
#include <vector>

#include "backends/dashboard/network_proc_queue.h"

namespace veltrad::backends {

namespace {
bool isSame(const std::weak_ptr<NetworkProcQueue>& one, const std::shared_ptr<NetworkProcQueue>& other) {
  return !one.owner_before(other) && !other.owner_before(one);
}
}  // namespace

std::shared_ptr<NetworkProcQueue> DashboardQueues::join(const Route& route) {
  const auto queues = sharedOn(route);
  for (const bool alone : {true, false}) {
    if (!alone && queues.size() < kMostShared) return nullptr;
    for (const auto& queue : queues) {
      if (!queue->join(alone)) continue;
      joined(route, queue);
      return queue;
    }
  }
  return nullptr;
}

std::vector<std::shared_ptr<NetworkProcQueue>> DashboardQueues::sharedOn(const Route& route) {
  std::vector<std::shared_ptr<NetworkProcQueue>> queues;
  const Lock held(_mutex);
  const auto found = _shared.find(route);
  if (found == _shared.end()) return queues;
  for (const auto& one : found->second) {
    if (auto queue = one.lock()) queues.push_back(std::move(queue));
  }
  return queues;
}

void DashboardQueues::joined(const Route& route, const std::shared_ptr<NetworkProcQueue>& queue) {
  const Lock held(_mutex);
  forget(queue);
  auto& queues = _shared[route];
  const auto place =
      std::find_if(queues.begin(), queues.end(), [&queue](const auto& one) { return isSame(one, queue); });
  if (place != queues.end()) queues.splice(queues.end(), queues, place);
}

void DashboardQueues::share(const Route& route, const std::shared_ptr<NetworkProcQueue>& queue) {
  const Lock held(_mutex);
  for (auto& [other, queues] : _shared) std::erase_if(queues, [](const auto& one) { return one.expired(); });
  std::erase_if(_shared, [](const auto& entry) { return entry.second.empty(); });
  _shared[route].push_back(queue);
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
    for (const auto& [route, shared] : _shared) {
      for (const auto& queue : shared) queues.push_back(queue.lock());
    }
  }
  for (const auto& queue : queues) {
    if (queue && refuses(queue->host())) queue->dropWaiting();
  }
}

// Removes the queue, and those that have ended. Takes no reference, because releasing the last one under the
// lock would destroy a queue there.
void DashboardQueues::forget(const std::shared_ptr<NetworkProcQueue>& queue) {
  std::erase_if(_lingering,
                [&queue](const Lingering& one) { return isSame(one.queue, queue) || one.queue.expired(); });
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
