// Which HTTP request runs next. HTTP thread.
#include "http/http_waiting.h"

#include <algorithm>
#include <utility>

namespace veltrad::http {

using Lane = HTTPRequest::Lane;

HTTPWaiting::Bulk* HTTPWaiting::bulkOf(Lane lane) {
  return lane == Lane::upload ? &_bulk[0] : lane == Lane::logData ? &_bulk[1] : nullptr;
}

void HTTPWaiting::add(Transfers& arrived) {
  const CurlTransfer& first = *arrived.front();
  Bulk* const bulk = bulkOf(first.lane());
  Transfers& queue = first.lane() == Lane::storebag ? _storebags
                     : bulk != nullptr              ? bulk->waiting
                                                    : _hosts[first.host()].posts;
  queue.splice(queue.end(), arrived, arrived.begin());
}

HTTPWaiting::Transfer HTTPWaiting::next(CurlTransfer::Time now) {
  if (!_storebags.empty()) return pop(_storebags, _storebags.begin());
  for (Bulk& bulk : _bulk) {
    if (Transfer transfer = nextOf(bulk)) return transfer;
  }
  for (auto& [name, host] : _hosts) {
    if (host.running >= kPostConnections) continue;
    const auto found = host.firstInTurn(now);
    if (found == host.posts.end()) continue;
    if ((*found)->sequence() != 0) ++host.runningOfSequence[(*found)->sequence()];
    ++host.running;
    return pop(host.posts, found);
  }
  return nullptr;
}

HTTPWaiting::Transfer HTTPWaiting::nextOf(Bulk& bulk) {
  if (bulk.running >= kBulkRunning) return nullptr;
  for (auto at = bulk.waiting.begin(); at != bulk.waiting.end(); ++at) {
    Host& host = _hosts[(*at)->host()];
    if (host.running >= kPostConnections || host.bulkRunning >= kBulkConnections) continue;
    ++host.running;
    ++host.bulkRunning;
    ++bulk.running;
    return pop(bulk.waiting, at);
  }
  return nullptr;
}

HTTPWaiting::Transfers::iterator HTTPWaiting::Host::firstInTurn(CurlTransfer::Time now) {
  std::uintptr_t busy = 0;  // mostly all that wait are of one sequence: it is looked up once
  return std::find_if(posts.begin(), posts.end(), [&](const Transfer& post) {
    const bool waits = post->sequence() == busy || runningOfSequence.count(post->sequence()) > 0;
    if (post->sequence() == 0 || !waits || post->arrived() + kLongestInOrder <= now) return true;
    busy = post->sequence();
    return false;
  });
}

void HTTPWaiting::ended(const CurlTransfer& transfer) {
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

bool HTTPWaiting::empty() const {
  const auto nothing = [](const auto& queue) { return queue.waiting.empty(); };
  return _storebags.empty() && std::all_of(_bulk.begin(), _bulk.end(), nothing) &&
         std::all_of(_hosts.begin(), _hosts.end(),
                     [](const auto& host) { return host.second.posts.empty(); });
}

HTTPWaiting::Transfers HTTPWaiting::take(const Predicate& matches) {
  Transfers taken;
  const auto takeFrom = [&](Transfers& queue) {
    for (auto at = queue.begin(); at != queue.end();) {
      const auto one = at++;
      if (matches(**one)) taken.splice(taken.end(), queue, one);
    }
  };
  takeFrom(_storebags);
  for (Bulk& bulk : _bulk) takeFrom(bulk.waiting);
  for (auto& [name, host] : _hosts) takeFrom(host.posts);
  std::erase_if(_hosts,
                [](const auto& host) { return host.second.running == 0 && host.second.posts.empty(); });
  return taken;
}

HTTPWaiting::Transfer HTTPWaiting::pop(Transfers& queue, Transfers::iterator at) {
  Transfer transfer = std::move(*at);
  queue.erase(at);
  return transfer;
}

}  // namespace veltrad::http
