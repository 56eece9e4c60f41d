// SPDX-License-Identifier: Apache-2.0
// Accounts of the memory that the daemon keeps for its clients: one for each user id, and a total. Any
// thread.
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
  // Of one user id: in all; of these, what outlives the call that made it; of these, unfinished frames.
  std::size_t user = 56u << 20;
  std::size_t userKept = 40u << 20;
  std::size_t userUnfinished = 24u << 20;
  // Of all user ids together.
  std::size_t all = 256u << 20;
  std::size_t allKept = 192u << 20;
};

// working: ends by itself, such as a running call or an upload. kept: outlives its call, such as batches,
// posts, waiting copies and lingering dashboards. unfinished: kept bytes of a frame that its client may never
// finish.
enum class MemoryUse { working, kept, unfinished };

// A number of bytes charged to an account, released by the object that frees the memory.
class Charge {
 public:
  Charge() = default;
  Charge(Charge&& other) noexcept;
  Charge& operator=(Charge&& other) noexcept;
  ~Charge() { release(); }

  std::size_t bytes() const { return _bytes; }
  // False if the account has no room for more; then nothing has changed. Shrinking always succeeds. A charge
  // without an account can only be resized to 0.
  [[nodiscard]] bool resize(std::size_t bytes);
  // Takes over the bytes of a charge of the same account and use.
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

// Something whose parts may be dropped, oldest first, for newer data of the same user.
class Evictable {
 public:
  virtual ~Evictable() = default;
  // The turn (MemoryAccount::nextTurn) of its oldest part; absent if it has none.
  virtual std::optional<std::uint64_t> oldestTurn() const = 0;
  // Drops and counts that part.
  virtual void dropOldest() = 0;
};

// Above all other ranks, because memory is released under any lock.
inline constexpr LockRank kMemoryRank{102};

// The sums over all user ids, shared by the accounts.
class MemoryTotals {
 public:
  explicit MemoryTotals(MemoryBounds bounds) : bounds(bounds) {}

  const MemoryBounds bounds;
  std::atomic<std::size_t> used{0};
  std::atomic<std::size_t> kept{0};
  // Threads in waitToCharge().
  std::atomic<std::size_t> waiting{0};
  Mutex mutex LEAF_LOCK{kMemoryRank};
  Condition changed;
};

// The account of one user id. Its locks are leaves; evictables are called without holding any.
class MemoryAccount : public std::enable_shared_from_this<MemoryAccount> {
 public:
  MemoryAccount(unsigned uid, std::shared_ptr<MemoryTotals> totals) : _uid(uid), _totals(std::move(totals)) {}

  unsigned uid() const { return _uid; }
  std::size_t used() const { return _used.load(std::memory_order_relaxed); }
  // True if unfinished frames alone leave no room for `bytes` more, so that waiting is useless.
  bool unfinishedFull(std::size_t bytes) const;

  // These return nothing, or false, if there is no room.

  std::optional<Charge> tryCharge(std::size_t bytes, MemoryUse use);
  // Charges kept bytes; drops the user's oldest evictable parts to make room.
  std::optional<Charge> keep(std::size_t bytes);
  // The same for a charge that grows.
  bool keepMore(Charge& charge, std::size_t bytes);
  // Drops the oldest part of the account's evictables. False if there is none.
  bool dropOldest();
  // Charges working bytes. Waits for room until `giveUp`, which is called every tenth of a second, returns
  // true. The caller must not hold another working charge, or two callers could wait for each other.
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

// Finds a user id's account, which exists as long as somebody holds it.
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
