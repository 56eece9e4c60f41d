// The requests that may not use a connection yet: which one is next, which has waited too long. HTTP thread.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "platform/curl_transfer.h"

namespace veltrad::platform {

// Storebags go at once. Uploads run two at a time, in order. Posts of one sequence begin one after the other,
// but wait for each other no longer than kLongestInOrder. Posts and uploads share kPostConnections for each
// host, so that a host that hangs keeps neither the others nor its own storebags waiting. One thread only.
class HTTPWaiting {
 public:
  using Transfer = std::unique_ptr<CurlTransfer>;

  static constexpr std::size_t kConnections = 8;      // to one host
  static constexpr std::size_t kPostConnections = 6;  // of them; the others are the storebags'
  static constexpr std::size_t kUploads = 2;
  static constexpr std::chrono::milliseconds kLongestInOrder{100};

  void add(Transfer transfer);
  // The next one that may run, which now counts as running; null: none may.
  Transfer next(CurlTransfer::Time now);
  // A running one has ended: its place is free.
  void ended(const CurlTransfer& transfer);

  bool empty() const;
  using Predicate = std::function<bool(const CurlTransfer&)>;
  // Takes out those that match.
  std::vector<Transfer> take(const Predicate& matches);

 private:
  using Queue = std::deque<Transfer>;
  struct Host {
    std::size_t running = 0;
    Queue posts;
    std::map<std::uintptr_t, std::size_t> runningOfSequence;

    // The first of the posts that may begin.
    Queue::iterator firstInTurn(CurlTransfer::Time now);
  };

  static Transfer popFront(Queue& queue);
  static void takeFrom(Queue& queue, const Predicate& matches, std::vector<Transfer>& taken);

  Queue _storebags;
  Queue _uploads;
  std::size_t _uploadsRunning = 0;
  std::map<std::string, Host> _hosts;  // those with posts or uploads that wait or run
};

}  // namespace veltrad::platform
