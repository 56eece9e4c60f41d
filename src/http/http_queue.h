// The requests that may not use a connection yet: any thread leaves one here, the HTTP thread asks which is
// next.
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

// Storebags go at once. Uploads run three at a time, log data too, each in order but for hosts that are full.
// Posts of one sequence begin one after the other, but wait for each other no longer than kLongestInOrder.
// All but storebags share kPostConnections for each host, of which uploads and log data leave some to posts,
// so that a host that hangs or is slow keeps neither the others nor its own storebags and posts waiting.
//
// A request begins in next() and nowhere else. Its lock is a leaf; it never calls out. Lists, so that handing
// a transfer on needs no memory: what was admitted cannot be lost for want of it.
class HTTPQueue {
 public:
  using Time = CurlTransfer::Time;
  using Transfers = std::list<CurlTransfer>;

  static constexpr std::size_t kMostEvents = 1024;
  static constexpr std::size_t kConnections = 8;      // to one host
  static constexpr std::size_t kPostConnections = 6;  // of them; the others are the storebags'
  static constexpr std::size_t kBulkConnections = 4;  // of these, for uploads and log data
  static constexpr std::size_t kBulkRunning = 3;      // of each lane
  static constexpr std::chrono::milliseconds kLongestInOrder{100};

  // Any thread; but for waits and questions the caller wakes the HTTP thread afterwards.

  // `more`: the thread is already on its way. `full`: its lane is.
  enum class Added { first, more, full };
  // Takes the only one of `transfer`, or leaves it there: also where std::bad_alloc is thrown.
  Added add(Transfers& transfer);
  void failBlocking();
  bool blockingFails() const;
  void stop(bool forGood);
  // Kept when the HTTP thread has passed.
  std::future<void> addEmptyTask();
  // False when `deadline` passed first.
  bool waitUntilIdle(Time deadline);
  // Event posts that have neither completed nor failed.
  std::size_t events() const;

  // HTTP thread.

  struct Orders {
    bool failBlocking = false;  // those that wait in perform() end
    bool stopping = false;      // everything ends
    bool last = false;          // and then the thread
  };
  // Empty tasks pass.
  Orders look();
  // The one that may run now, which from here on counts as running; empty: none may. Where memory is short
  // std::bad_alloc is thrown and nothing has changed.
  Transfers next(Time now);
  bool empty() const;
  // Takes out those that match: their places in the lanes are free.
  using Predicate = std::function<bool(const CurlTransfer&)>;
  Transfers take(const Predicate& matches);
  // The same for one that ran, before its completion.
  void ended(const CurlTransfer& transfer);
  // After the completion, when what the request kept is free.
  void completed();

  // Moves one from list to list.
  static Transfers pop(Transfers& from, Transfers::iterator at);

 private:
  using Lane = HTTPRequest::Lane;
  struct Bulk {
    Transfers waiting;
    std::size_t running = 0;
  };
  struct Host {
    std::size_t running = 0;
    std::size_t bulkRunning = 0;  // of them
    Transfers posts;
    std::map<std::uintptr_t, std::size_t> runningOfSequence;

    // The first of the posts that may begin.
    Transfers::iterator firstInTurn(Time now);
  };

  Bulk* bulkOf(Lane lane) REQUIRES(_mutex);
  Transfers nextOf(Bulk& bulk) REQUIRES(_mutex);
  void leaves(const CurlTransfer& transfer) REQUIRES(_mutex);

  // Its 11 fields are one account: what waits, what runs, what was ordered.
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _idle;
  Transfers _storebags GUARDED_BY(_mutex);
  std::array<Bulk, 2> _bulk GUARDED_BY(_mutex);           // uploads, log data
  std::map<std::string, Host> _hosts GUARDED_BY(_mutex);  // those of posts that wait and of all that run
  std::size_t _underWay GUARDED_BY(_mutex) = 0;           // all lanes, completions that still run included
  std::size_t _events GUARDED_BY(_mutex) = 0;
  std::vector<std::promise<void>> _emptyTasks GUARDED_BY(_mutex);
  bool _news GUARDED_BY(_mutex) = false;  // something came since the HTTP thread looked
  Orders _orders GUARDED_BY(_mutex);
};

}  // namespace veltrad::http
