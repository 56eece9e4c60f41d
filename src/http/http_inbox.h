// Where any thread leaves requests for the HTTP thread, and the account of what is under way.
#pragma once

#include <chrono>
#include <cstdint>
#include <list>
#include <memory>

#include "base/mutex.h"
#include "http/curl_transfer.h"

namespace veltrad::http {

// Its lock is a leaf. Never calls out.
class HTTPInbox {
 public:
  using Time = CurlTransfer::Time;

  // A list, so that handing one on needs no memory: what was admitted cannot be lost for want of it.
  using Transfers = std::list<std::unique_ptr<CurlTransfer>>;
  enum class Added { first, more, refused };

  static constexpr std::size_t kMostEvents = 1024;

  struct Taken {
    Transfers transfers;
    bool failBlocking = false;  // those that wait in perform() end
    bool stopping = false;      // everything ends
    bool last = false;          // and then the thread
  };

  // Any thread; but for waits and questions the caller wakes the HTTP thread afterwards.

  // Takes the only one of `transfer`, unless its lane is full. `more`: the thread is already on its way.
  Added add(Transfers& transfer);
  void failBlocking();
  bool blockingFails() const;
  void stop(bool forGood);
  std::uint64_t addEmptyTask();

  // False when `deadline` passed first.
  bool waitUntilIdle(Time deadline);
  bool waitForEmptyTask(std::uint64_t task, Time deadline);
  std::size_t events() const;

  // HTTP thread.

  Taken take();
  // Before the completion: gives its place in the lane back.
  void ended(HTTPRequest::Lane lane);
  // After the completion, when what the request kept is free.
  void completed();

 private:
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  Transfers _arrived GUARDED_BY(_mutex);
  std::size_t _underWay GUARDED_BY(_mutex) = 0;  // all lanes, completions that still run included
  std::size_t _events GUARDED_BY(_mutex) = 0;
  std::uint64_t _tasksAdded GUARDED_BY(_mutex) = 0;
  std::uint64_t _tasksPassed GUARDED_BY(_mutex) = 0;
  bool _failBlocking GUARDED_BY(_mutex) = false;
  bool _stopping GUARDED_BY(_mutex) = false;
  bool _last GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::http
