// SPDX-License-Identifier: Apache-2.0
// The queue of the spool: its posts, when each may leave, and which new posts must wait behind them. Does no
// disk work; any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "backends/https/spool_waits.h"
#include "base/mutex.h"
#include "http/http_client.h"
#include "support/spool_index.h"

namespace veltrad::platform {
class Clock;
}  // namespace veltrad::platform

namespace veltrad::backends {

// Its 11 fields are the places, the addresses, the open posts and the state of the spool.
class SpoolQueue {
 public:
  using Name = support::SpoolFolder::Name;
  using Place = support::SpoolPlace;

  struct AddressStatus {
    std::string address;
    support::SpoolIndex::Amount amount;
    double nextTry = 0;  // seconds since 1970; 0: at once
    std::string lastError;
  };
  // A post that is made now.
  struct Admission {
    std::uint64_t order = 0;
    std::uint64_t emptied = 0;  // how often the queue had been emptied
    // Why it must be kept at once, as one line; absent if it may begin; it is open until landed().
    std::optional<std::string> refusal;
  };

  // The clock must outlive it.
  SpoolQueue(const platform::Clock& clock, const support::SpoolBounds& bounds, const SpoolPace& pace)
      : _clock(clock), _pace(pace), _index(bounds) {}

  // While the spool is being read every post is refused.
  Admission admit(const std::string& address, std::uint32_t connection);
  // An open post has ended and is not kept. `answered`: the server has given an answer.
  void landed(std::uint64_t order, const std::string& address, bool answered);
  // An open post has ended and is kept, and its result concerns the server.
  void failed(const std::string& address, const http::HTTPResult& result);
  // Takes a place in state `writing`, so that later ones of its connection queue behind it. False: the queue
  // has been emptied since it was admitted.
  bool add(Place place, const std::string& address, std::uint32_t uid, std::uint64_t emptied);
  // Adds a post of an earlier daemon, or replaces one that could not be read before.
  void addLoaded(Place place, const std::string& address, std::uint32_t uid, const std::string& lastError);
  // Adds a post of an earlier daemon that cannot be read yet. Its bytes count, and it is not sent.
  void addUnread(const Name& name, std::uint32_t bytes);
  std::vector<Name> unread() const;
  void allLoaded();
  bool isLoaded() const { return waitUntilLoaded({}); }
  // False if the deadline passed first.
  bool waitUntilLoaded(std::chrono::steady_clock::time_point deadline) const;

  // The size of its file is known. False: it is not there any more.
  bool setBytes(std::uint64_t order, std::uint32_t bytes);
  // It is on disk. Returns it as it is now; nothing: it is not there any more.
  std::optional<Place> written(std::uint64_t order);
  bool holds(std::uint64_t order) const;
  // As it was; nothing: it is not there.
  std::optional<Place> takeOut(std::uint64_t order);
  // The post to drop while a bound is exceeded.
  std::optional<Name> excess(support::SpoolIndex::Excess& why) const;
  // The oldest, if it was made before.
  std::optional<Name> olderThan(std::uint64_t order) const;
  // The order of the newest post that was ever made.
  std::uint64_t lastOrder() const;

  // Posts that leave now. `next`: when to ask again, in seconds from now.
  std::vector<Name> takeDue(double& next);
  // A due post has ended with this result. Returns its place; absent if it was taken out meanwhile. A post
  // that is not kept is taken out.
  std::optional<Place> tried(std::uint64_t order, const http::HTTPResult& result);
  // A due post was not tried, and its address waits for so many seconds.
  void putBack(std::uint64_t order, double seconds);
  // The network may be there again.
  void woken();
  // Makes all posts due now, limited only by the pace. Returns the number of posts.
  std::size_t hurry();
  // Open posts are not kept if they fail. Returns the kept posts, which stay in the queue.
  std::vector<Name> empty();
  // Nothing leaves any more.
  void stopSending();

  // So many after this order, without those that are being written.
  std::vector<Name> names(std::uint64_t after, std::size_t most) const;
  std::optional<Name> named(const support::PostID& id) const;
  std::optional<Place> place(std::uint64_t order) const;
  // By the number in a place.
  AddressStatus statusAt(std::uint16_t address) const;
  std::vector<AddressStatus> addresses() const;

  // In seconds from now.
  double waitAt(std::uint16_t address) const;
  support::SpoolIndex::Amount amount() const;

 private:
  struct Flight {
    std::uint64_t order = 0;
    std::uint32_t connection = 0;
    std::uint16_t address = 0;
  };

  double wallOffset() const;
  std::uint16_t numberOf(const std::string& address) REQUIRES(_mutex);
  void land(std::uint64_t order) REQUIRES(_mutex);
  void remove(Place& place) REQUIRES(_mutex);
  bool blocked(const Place& place) const REQUIRES(_mutex);
  AddressStatus statusOf(std::uint16_t address) const REQUIRES(_mutex);

  const platform::Clock& _clock;
  const SpoolPace _pace;

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  mutable support::SpoolIndex _index GUARDED_BY(_mutex);
  // By the index's numbers of addresses.
  std::vector<SpoolWait> _waits GUARDED_BY(_mutex);
  std::vector<Flight> _underWay GUARDED_BY(_mutex);
  std::uint64_t _lastOrder GUARDED_BY(_mutex) = 0;
  std::uint64_t _emptied GUARDED_BY(_mutex) = 0;
  bool _allLoaded GUARDED_BY(_mutex) = false;
  bool _sends GUARDED_BY(_mutex) = true;
  mutable Condition _loaded;
};

}  // namespace veltrad::backends
