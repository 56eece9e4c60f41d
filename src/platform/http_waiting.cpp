// Which HTTP request runs next. HTTP thread.
#include "platform/http_waiting.h"

#include <algorithm>
#include <utility>

namespace veltrad::platform {

using Lane = HTTPRequest::Lane;

void HTTPWaiting::add(Transfer transfer) {
  Host* host = transfer->lane() == Lane::storebag ? nullptr : &_hosts[transfer->host()];
  Queue& queue = host == nullptr ? _storebags : transfer->lane() == Lane::upload || transfer->lane() == Lane::logData ? _uploads : host->posts;
  queue.push_back(std::move(transfer));
}

HTTPWaiting::Transfer HTTPWaiting::next(CurlTransfer::Time now) {
  if (!_storebags.empty()) return popFront(_storebags);
  if (!_uploads.empty() && _uploadsRunning < kUploads) {
    Host& host = _hosts[_uploads.front()->host()];
    if (host.running < kPostConnections) {
      ++host.running;
      ++_uploadsRunning;
      return popFront(_uploads);
    }
  }
  for (auto& [name, host] : _hosts) {
    if (host.running >= kPostConnections) continue;
    const auto found = host.firstInTurn(now);
    if (found == host.posts.end()) continue;
    Transfer post = std::move(*found);
    host.posts.erase(found);
    ++host.running;
    if (post->sequence() != 0) ++host.runningOfSequence[post->sequence()];
    return post;
  }
  return nullptr;
}

HTTPWaiting::Queue::iterator HTTPWaiting::Host::firstInTurn(CurlTransfer::Time now) {
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
  if (transfer.lane() == Lane::upload || transfer.lane() == Lane::logData) --_uploadsRunning;
  const auto found = _hosts.find(transfer.host());
  auto& sequences = found->second.runningOfSequence;
  const auto sequence = sequences.find(transfer.sequence());
  if (sequence != sequences.end() && --sequence->second == 0) sequences.erase(sequence);
  if (--found->second.running == 0 && found->second.posts.empty()) _hosts.erase(found);
}

bool HTTPWaiting::empty() const {
  return _storebags.empty() && _uploads.empty() &&
         std::all_of(_hosts.begin(), _hosts.end(),
                     [](const auto& host) { return host.second.posts.empty(); });
}

std::vector<HTTPWaiting::Transfer> HTTPWaiting::take(const Predicate& matches) {
  std::vector<Transfer> taken;
  takeFrom(_storebags, matches, taken);
  takeFrom(_uploads, matches, taken);
  for (auto& [name, host] : _hosts) takeFrom(host.posts, matches, taken);
  std::erase_if(_hosts,
                [](const auto& host) { return host.second.running == 0 && host.second.posts.empty(); });
  return taken;
}

HTTPWaiting::Transfer HTTPWaiting::popFront(Queue& queue) {
  Transfer front = std::move(queue.front());
  queue.pop_front();
  return front;
}

void HTTPWaiting::takeFrom(Queue& queue, const Predicate& matches, std::vector<Transfer>& taken) {
  const auto first = std::stable_partition(queue.begin(), queue.end(),
                                           [&](const Transfer& transfer) { return !matches(*transfer); });
  taken.insert(taken.end(), std::make_move_iterator(first), std::make_move_iterator(queue.end()));
  queue.erase(first, queue.end());
}

}  // namespace veltrad::platform
