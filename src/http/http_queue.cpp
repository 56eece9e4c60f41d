// SPDX-License-Identifier: Apache-2.0
// Decides which HTTP request runs next, and counts those in progress.
#include "http/http_queue.h"

#include <algorithm>
#include <utility>

namespace veltrad::http {

HTTPQueue::Added HTTPQueue::add(Transfers& transfer) {
  const CurlTransfer& one = transfer.front();
  const Lock lock(_mutex);
  if (one.lane() == Lane::event && _events >= kMostEvents) return Added::full;
  Bulk* const bulk = bulkOf(one.lane());
  Transfers& queue = one.lane() == Lane::storebag ? _storebags
                     : bulk != nullptr            ? bulk->waiting
                                                  : _hosts[one.host()].posts;
  if (one.lane() == Lane::event) ++_events;
  ++_underWay;
  queue.splice(queue.end(), transfer);
  return std::exchange(_news, true) ? Added::more : Added::first;
}

void HTTPQueue::failBlocking() {
  const Lock lock(_mutex);
  _orders.failBlocking = true;
}

bool HTTPQueue::blockingFails() const {
  const Lock lock(_mutex);
  return _orders.failBlocking;
}

void HTTPQueue::stop(bool forGood) {
  const Lock lock(_mutex);
  _orders.stopping = true;
  _orders.last = _orders.last || forGood;
}

void HTTPQueue::endRefused(bool running) {
  const Lock lock(_mutex);
  _orders.askWaiting = true;
  _orders.askRunning = _orders.askRunning || running;
}

std::future<std::vector<RequestUnderWay>> HTTPQueue::refuseWaiting(bool all) {
  Refusal refusal{all, {}};
  auto answer = refusal.answer.get_future();
  const Lock lock(_mutex);
  _refusals.push_back(std::move(refusal));
  return answer;
}

std::vector<HTTPQueue::Refusal> HTTPQueue::takeRefusals() {
  const Lock lock(_mutex);
  return std::exchange(_refusals, {});
}

std::future<void> HTTPQueue::addEmptyTask() {
  std::promise<void> task;
  std::future<void> passed = task.get_future();
  const Lock lock(_mutex);
  _emptyTasks.push_back(std::move(task));
  return passed;
}

bool HTTPQueue::waitUntilIdle(Time deadline) {
  const Lock lock(_mutex);
  while (_underWay != 0) {
    if (!_idle.waitUntil(_mutex, deadline)) return _underWay == 0;
  }
  return true;
}

std::size_t HTTPQueue::events() const {
  const Lock lock(_mutex);
  return _events;
}

HTTPQueue::Orders HTTPQueue::look() {
  const Lock lock(_mutex);
  _news = false;
  for (std::promise<void>& task : _emptyTasks) task.set_value();
  _emptyTasks.clear();
  const Orders orders = _orders;
  _orders.askWaiting = _orders.askRunning = false;
  return orders;
}

// A stop may have been ordered since look(); then no further transfer begins.
HTTPQueue::Transfers HTTPQueue::next(Time now, bool storebagsAlone) {
  const Lock lock(_mutex);
  if (_orders.stopping) return {};
  if (!_storebags.empty()) return pop(_storebags, _storebags.begin());
  if (storebagsAlone) return {};
  for (Bulk& bulk : _bulk) {
    if (Transfers one = nextOf(bulk); !one.empty()) return one;
  }
  for (auto& [name, host] : _hosts) {
    if (host.running >= kPostConnections) continue;
    const auto found = host.firstInTurn(now);
    if (found == host.posts.end()) continue;
    if (found->sequence() != 0) ++host.runningOfSequence[found->sequence()];
    ++host.running;
    return pop(host.posts, found);
  }
  return {};
}

HTTPQueue::Transfers HTTPQueue::nextOf(Bulk& bulk) {
  if (bulk.running >= kBulkRunning) return {};
  for (auto at = bulk.waiting.begin(); at != bulk.waiting.end(); ++at) {
    Host& host = _hosts[at->host()];
    if (host.running >= kPostConnections || host.bulkRunning >= kBulkConnections) continue;
    ++host.running;
    ++host.bulkRunning;
    ++bulk.running;
    return pop(bulk.waiting, at);
  }
  return {};
}

HTTPQueue::Transfers::iterator HTTPQueue::Host::firstInTurn(Time now) {
  std::uintptr_t busy = 0;  // saves look-ups, since most posts that wait are of one sequence
  return std::find_if(posts.begin(), posts.end(), [&](const CurlTransfer& post) {
    const bool waits = post.sequence() == busy || runningOfSequence.count(post.sequence()) > 0;
    if (post.sequence() == 0 || !waits || post.arrived() + kLongestInOrder <= now) return true;
    busy = post.sequence();
    return false;
  });
}

bool HTTPQueue::empty() const {
  const Lock lock(_mutex);
  return _storebags.empty() &&
         std::all_of(_bulk.begin(), _bulk.end(), [](const Bulk& bulk) { return bulk.waiting.empty(); }) &&
         std::all_of(_hosts.begin(), _hosts.end(),
                     [](const auto& host) { return host.second.posts.empty(); });
}

HTTPQueue::Transfers HTTPQueue::take(const Predicate& matches) {
  Transfers taken;
  const auto takeFrom = [&](Transfers& queue) {
    for (auto at = queue.begin(); at != queue.end();) {
      const auto one = at++;
      if (matches(*one)) taken.splice(taken.end(), queue, one);
    }
  };
  const Lock lock(_mutex);
  takeFrom(_storebags);
  for (Bulk& bulk : _bulk) takeFrom(bulk.waiting);
  for (auto& [name, host] : _hosts) takeFrom(host.posts);
  std::erase_if(_hosts,
                [](const auto& host) { return host.second.running == 0 && host.second.posts.empty(); });
  for (const CurlTransfer& transfer : taken) leaves(transfer);
  return taken;
}

void HTTPQueue::ended(const CurlTransfer& transfer) {
  const Lock lock(_mutex);
  leaves(transfer);
  if (transfer.lane() == Lane::storebag) return;
  const auto found = _hosts.find(transfer.host());
  Host& host = found->second;
  if (Bulk* const bulk = bulkOf(transfer.lane())) {
    --bulk->running;
    --host.bulkRunning;
  }
  const auto sequence = host.runningOfSequence.find(transfer.sequence());
  if (sequence != host.runningOfSequence.end() && --sequence->second == 0)
    host.runningOfSequence.erase(sequence);
  if (--host.running == 0 && host.posts.empty()) _hosts.erase(found);
}

void HTTPQueue::completed() {
  const Lock lock(_mutex);
  if (--_underWay == 0) _idle.notifyAll();
}

void HTTPQueue::leaves(const CurlTransfer& transfer) {
  if (transfer.lane() == Lane::event) --_events;
}

HTTPQueue::Transfers HTTPQueue::pop(Transfers& from, Transfers::iterator at) {
  Transfers one;
  one.splice(one.end(), from, at);
  return one;
}

HTTPQueue::Bulk* HTTPQueue::bulkOf(Lane lane) {
  return lane == Lane::upload ? &_bulk[0] : lane == Lane::logData ? &_bulk[1] : nullptr;
}

}  // namespace veltrad::http
