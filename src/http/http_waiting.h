// The requests that may not use a connection yet: which one is next, which has waited too long. HTTP thread.
#pragma once

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <string>

#include "http/http_inbox.h"

namespace veltrad::http {

// Storebags go at once. Uploads run three at a time, log data too, each in order but for hosts that are full.
// Posts of one sequence begin one after the other, but wait for each other no longer than kLongestInOrder.
// All but storebags share kPostConnections for each host, of which uploads and log data leave some to posts,
// so that a host that hangs or is slow keeps neither the others nor its own storebags and posts waiting. One
// thread only; where memory is short std::bad_alloc is thrown and nothing has changed.
class HTTPWaiting {
 public:
  using Transfers = HTTPInbox::Transfers;
  using Transfer = Transfers::value_type;

  static constexpr std::size_t kConnections = 8;      // to one host
  static constexpr std::size_t kPostConnections = 6;  // of them; the others are the storebags'
  static constexpr std::size_t kBulkConnections = 4;  // of these, for uploads and log data
  static constexpr std::size_t kBulkRunning = 3;      // of each lane
  static constexpr std::chrono::milliseconds kLongestInOrder{100};

  // Takes the first of them.
  void add(Transfers& arrived);
  // The next one that may run, which now counts as running; null: none may.
  Transfer next(CurlTransfer::Time now);
  // A running one has ended: its place is free.
  void ended(const CurlTransfer& transfer);

  bool empty() const;
  using Predicate = std::function<bool(const CurlTransfer&)>;
  // Takes out those that match.
  Transfers take(const Predicate& matches);

 private:
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
    Transfers::iterator firstInTurn(CurlTransfer::Time now);
  };

  Bulk* bulkOf(HTTPRequest::Lane lane);
  Transfer nextOf(Bulk& bulk);
  static Transfer pop(Transfers& queue, Transfers::iterator at);

  Transfers _storebags;
  std::array<Bulk, 2> _bulk;           // uploads, log data
  std::map<std::string, Host> _hosts;  // those of posts that wait and of all that run
};

}  // namespace veltrad::http
