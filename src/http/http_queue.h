// SPDX-License-Identifier: Apache-2.0
// The queue of HTTP requests, from any thread to the HTTP thread.
#pragma once

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <future>
#include <list>
#include <map>
#include <string>
#include <vector>

#include "base/mutex.h"
#include "http/curl_transfer.h"

namespace veltrad::http {

// Storebag requests begin at once. Three uploads and three uploads of log data run at a time, in order except
// for hosts that are full. Posts of one sequence begin in order, but wait for each other no longer than
// kLongestInOrder. All except storebag requests share kPostConnections for each host, and uploads and log
// data leave some of these to posts. So a slow host delays neither other hosts nor its own storebag requests
// and posts.
//
// Only next() begins a request. Its lock is a leaf. Transfers are in lists, so that moving one needs no
// memory and an admitted request cannot be lost.
class HTTPQueue {
 public:
  using Time = CurlTransfer::Time;
  using Transfers = std::list<CurlTransfer>;

  static constexpr std::size_t kMostEvents = 1024;
  // Connections to one host: in all; of these, for all but storebag requests; of these, for uploads and log
  // data.
  static constexpr std::size_t kConnections = 8;
  static constexpr std::size_t kPostConnections = 6;
  static constexpr std::size_t kBulkConnections = 4;
  // Uploads that run at a time, and the same for log data.
  static constexpr std::size_t kBulkRunning = 3;
  static constexpr std::chrono::milliseconds kLongestInOrder{100};

  // Called by any thread, which wakes the HTTP thread after add(), failBlocking(), stop(), endRefused() and
  // addEmptyTask().

  // more: the HTTP thread was woken before. full: the lane is full.
  enum class Added { first, more, full };
  // Takes the only element of `transfer`. It stays there if the lane is full or std::bad_alloc is thrown.
  Added add(Transfers& transfer);
  void failBlocking();
  bool blockingFails() const;
  void stop(bool forGood);
  void endRefused(bool running);
  // Fulfilled by the HTTP thread, which takes the order with look().
  struct Refusal {
    bool all = false;
    std::promise<std::vector<RequestUnderWay>> answer;
  };
  std::future<std::vector<RequestUnderWay>> refuseWaiting(bool all);
  // Ready when the HTTP thread has called look().
  std::future<void> addEmptyTask();
  // False if `deadline` passed first.
  bool waitUntilIdle(Time deadline);
  // The number of event posts that have not ended.
  std::size_t events() const;

  // Called by the HTTP thread.

  // failBlocking: end the transfers of perform(). stopping: end all transfers. last: then end the thread.
  // askWaiting, askRunning: once, end those that the gate refuses.
  struct Orders {
    bool failBlocking = false;
    bool stopping = false;
    bool last = false;
    bool askWaiting = false;
    bool askRunning = false;
  };
  Orders look();
  std::vector<Refusal> takeRefusals();
  // A transfer that may run now, which is counted as running; empty if none may. With `storebagsAlone`, the
  // others wait. If std::bad_alloc is thrown, nothing has changed.
  Transfers next(Time now, bool storebagsAlone = false);
  bool empty() const;
  // Removes the waiting transfers that match.
  using Predicate = std::function<bool(const CurlTransfer&)>;
  Transfers take(const Predicate& matches);
  // To be called when a running transfer has ended, before its completion.
  void ended(const CurlTransfer& transfer);
  // To be called after the completion, when the memory of the request is free.
  void completed();

  // Moves an element into a list of its own.
  static Transfers pop(Transfers& from, Transfers::iterator at);

 private:
  using Lane = HTTPRequest::Lane;
  struct Bulk {
    Transfers waiting;
    std::size_t running = 0;
  };
  struct Host {
    std::size_t running = 0;
    // Of these, uploads and log data.
    std::size_t bulkRunning = 0;
    Transfers posts;
    std::map<std::uintptr_t, std::size_t> runningOfSequence;

    // The first post that may begin.
    Transfers::iterator firstInTurn(Time now);
  };

  Bulk* bulkOf(Lane lane) REQUIRES(_mutex);
  Transfers nextOf(Bulk& bulk) REQUIRES(_mutex);
  void leaves(const CurlTransfer& transfer) REQUIRES(_mutex);

  // One lock guards waiting and running transfers and the orders.
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _idle;
  Transfers _storebags GUARDED_BY(_mutex);
  // Uploads, log data.
  std::array<Bulk, 2> _bulk GUARDED_BY(_mutex);
  std::map<std::string, Host> _hosts GUARDED_BY(_mutex);
  // Of all lanes, including transfers whose completions are running.
  std::size_t _underWay GUARDED_BY(_mutex) = 0;
  std::size_t _events GUARDED_BY(_mutex) = 0;
  std::vector<std::promise<void>> _emptyTasks GUARDED_BY(_mutex);
  std::vector<Refusal> _refusals GUARDED_BY(_mutex);
  // Whether something was added since the last look().
  bool _news GUARDED_BY(_mutex) = false;
  Orders _orders GUARDED_BY(_mutex);
};

}  // namespace veltrad::http
