// What the daemon keeps for its clients, in bytes: one account for each user id, one sum for all. Any thread.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <vector>

#include "base/mutex.h"

namespace veltrad::platform {

class MemoryAccount;

struct MemoryBounds {
  std::size_t user = 56u << 20;            // of one user id, in all
  std::size_t userKept = 40u << 20;        // of these, what outlives the call that made it
  std::size_t userUnfinished = 24u << 20;  // of these again, frames that have not come whole
  std::size_t all = 256u << 20;            // of all user ids together
  std::size_t allKept = 192u << 20;
};

enum class MemoryUse {
  working,     // ends by itself: a call that runs, an upload
  kept,        // outlives its call: batches, posts, copies that wait, lingering dashboards
  unfinished,  // kept, too: the bytes of a frame that its client may never finish
};

// Bytes of an account, paid back by the object that frees the memory. An empty one holds nothing.
class Charge {
 public:
  Charge() = default;
  Charge(Charge&& other) noexcept;
  Charge& operator=(Charge&& other) noexcept;
  ~Charge() { release(); }

  std::size_t bytes() const { return _bytes; }
  // False: there is no room for more, and nothing has changed. Less is always possible. Of an empty charge:
  // false unless `bytes` is 0.
  [[nodiscard]] bool resize(std::size_t bytes);
  // Takes over the other's bytes, which are of the same account and use.
  void add(Charge other);
  void release();

 private:
  friend class MemoryAccount;
  Charge(std::shared_ptr<MemoryAccount> account, std::size_t bytes, MemoryUse use)
      : _account(std::move(account)), _bytes(bytes), _use(use) {}

  std::shared_ptr<MemoryAccount> _account;
  std::size_t _bytes = 0;
  MemoryUse _use = MemoryUse::working;
};

// Something that is kept and may be given up for newer things of the same user, oldest first.
class Evictable {
 public:
  virtual ~Evictable() = default;
  // The turn (MemoryAccount::nextTurn) of its oldest part; nothing: it holds none.
  virtual std::optional<std::uint64_t> oldestTurn() const = 0;
  // Drops and counts that part.
  virtual void dropOldest() = 0;
};

// Of those who wait for memory, which is paid back under any lock, the log sink's included.
inline constexpr LockRank kMemoryRank{102};

// The sums of all user ids. Outlives its accounts' charges through them.
class MemoryTotals {
 public:
  explicit MemoryTotals(MemoryBounds bounds) : bounds(bounds) {}

  const MemoryBounds bounds;
  std::atomic<std::size_t> used{0};
  std::atomic<std::size_t> kept{0};
  std::atomic<std::size_t> waiting{0};  // threads in waitToCharge()
  Mutex mutex LEAF_LOCK{kMemoryRank};
  Condition changed;
};

// One user id. Its locks are leaves; evictables are called without any.
class MemoryAccount : public std::enable_shared_from_this<MemoryAccount> {
 public:
  MemoryAccount(unsigned uid, std::shared_ptr<MemoryTotals> totals) : _uid(uid), _totals(std::move(totals)) {}

  unsigned uid() const { return _uid; }
  std::size_t used() const { return _used.load(std::memory_order_relaxed); }
  // True when unfinished frames alone leave no room for so many bytes more: no use to wait for it.
  bool unfinishedFull(std::size_t bytes) const;

  // Nothing: no room.
  std::optional<Charge> tryCharge(std::size_t bytes, MemoryUse use);
  // Kept bytes, for which the user's oldest evictable parts make room where they can. Nothing: no room.
  std::optional<Charge> keep(std::size_t bytes);
  // The same for a charge that grows; false: no room, and nothing has changed but what made room.
  bool keepMore(Charge& charge, std::size_t bytes);
  // Of the account's evictables the oldest part goes. False: there is none.
  bool dropOldest();
  // Working bytes; waits until there is room, as long as `giveUp` (asked every tenth of a second) is false.
  // The caller holds no other working charge, or two such callers may wait for each other.
  std::optional<Charge> waitToCharge(std::size_t bytes, const std::function<bool()>& giveUp);

  void add(const std::shared_ptr<Evictable>& evictable);
  std::uint64_t nextTurn() { return _turn.fetch_add(1, std::memory_order_relaxed); }

 private:
  friend class Charge;
  bool take(std::size_t bytes, MemoryUse use);
  void giveBack(std::size_t bytes, MemoryUse use);

  const unsigned _uid;
  const std::shared_ptr<MemoryTotals> _totals;
  std::atomic<std::size_t> _used{0};
  std::atomic<std::size_t> _kept{0};
  std::atomic<std::size_t> _unfinished{0};
  std::atomic<std::uint64_t> _turn{0};

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::vector<std::weak_ptr<Evictable>> _evictables GUARDED_BY(_mutex);
};

// Finds a user id's account, which lives as long as somebody holds it.
class MemoryBudget {
 public:
  explicit MemoryBudget(MemoryBounds bounds = {}) : _totals(std::make_shared<MemoryTotals>(bounds)) {}

  std::shared_ptr<MemoryAccount> accountOf(unsigned uid);
  std::size_t used() const { return _totals->used.load(std::memory_order_relaxed); }

 private:
  const std::shared_ptr<MemoryTotals> _totals;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::map<unsigned, std::weak_ptr<MemoryAccount>> _accounts GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
