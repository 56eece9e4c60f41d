// SPDX-License-Identifier: Apache-2.0
// Memory accounts: their sums, waiting for memory, and eviction.
#include "platform/memory_budget.h"

#include <chrono>
#include <utility>

namespace veltrad::platform {

namespace {

constexpr std::chrono::milliseconds kAskAgain{100};

bool takeFrom(std::atomic<std::size_t>& sum, std::size_t bytes, std::size_t bound) {
  std::size_t before = sum.load();
  do {
    if (bytes > bound || before > bound - bytes) return false;
  } while (!sum.compare_exchange_weak(before, before + bytes));
  return true;
}

// How many of the five sums of take() concern each MemoryUse.
constexpr std::size_t kSums[] = {2, 4, 5};
static_assert(std::size(kSums) == static_cast<std::size_t>(MemoryUse::unfinished) + 1);

}  // namespace

Charge::Charge(Charge&& other) noexcept
    : _account(std::move(other._account)), _bytes(std::exchange(other._bytes, 0)), _use(other._use) {}

Charge& Charge::operator=(Charge&& other) noexcept {
  if (this == &other) return *this;
  release();
  _account = std::move(other._account);
  _bytes = std::exchange(other._bytes, 0);
  _use = other._use;
  return *this;
}

bool Charge::resize(std::size_t bytes) {
  if (!_account) return bytes == 0;
  if (bytes > _bytes && !_account->take(bytes - _bytes, _use)) return false;
  if (bytes < _bytes) _account->giveBack(_bytes - bytes, _use);
  _bytes = bytes;
  return true;
}

void Charge::add(Charge other) {
  if (!_account) {
    *this = std::move(other);
    return;
  }
  _bytes += std::exchange(other._bytes, 0);
}

void Charge::release() {
  if (_account && _bytes > 0) _account->giveBack(_bytes, _use);
  _bytes = 0;
  _account.reset();
}

bool MemoryAccount::take(std::size_t bytes, MemoryUse use) {
  const MemoryBounds& bounds = _totals->bounds;
  const struct {
    std::atomic<std::size_t>& sum;
    std::size_t bound;
  } sums[] = {{_used, bounds.user},
              {_totals->used, bounds.all},
              {_kept, bounds.userKept},
              {_totals->kept, bounds.allKept},
              {_unfinished, bounds.userUnfinished}};
  const std::size_t count = kSums[static_cast<std::size_t>(use)];
  for (std::size_t i = 0; i < count; ++i) {
    if (takeFrom(sums[i].sum, bytes, sums[i].bound)) continue;
    while (i > 0) sums[--i].sum.fetch_sub(bytes);
    return false;
  }
  return true;
}

void MemoryAccount::giveBack(std::size_t bytes, MemoryUse use) {
  if (use == MemoryUse::unfinished) _unfinished.fetch_sub(bytes);
  if (use != MemoryUse::working) {
    _totals->kept.fetch_sub(bytes);
    _kept.fetch_sub(bytes);
  }
  _totals->used.fetch_sub(bytes);
  _used.fetch_sub(bytes);
  if (_totals->waiting.load() == 0) return;
  // Waiting threads check under the lock, so none of them misses this.
  const Lock held(_totals->mutex);
  _totals->changed.notifyAll();
}

bool MemoryAccount::unfinishedFull(std::size_t bytes) const {
  const std::size_t bound = _totals->bounds.userUnfinished;
  return bytes > bound || _unfinished.load() > bound - bytes;
}

std::optional<Charge> MemoryAccount::tryCharge(std::size_t bytes, MemoryUse use) {
  if (!take(bytes, use)) return std::nullopt;
  return Charge(shared_from_this(), bytes, use);
}

std::optional<Charge> MemoryAccount::keep(std::size_t bytes) {
  Charge charge(shared_from_this(), 0, MemoryUse::kept);
  if (!keepMore(charge, bytes)) return std::nullopt;
  return charge;
}

bool MemoryAccount::keepMore(Charge& charge, std::size_t bytes) {
  if (charge._bytes + bytes > _totals->bounds.userKept) return false;
  while (!charge.resize(charge._bytes + bytes)) {
    if (!dropOldest()) return false;
  }
  return true;
}

std::optional<Charge> MemoryAccount::waitToCharge(std::size_t bytes, const std::function<bool()>& giveUp) {
  if (take(bytes, MemoryUse::working)) return Charge(shared_from_this(), bytes, MemoryUse::working);
  if (bytes > _totals->bounds.user) return std::nullopt;
  _totals->waiting.fetch_add(1);
  bool taken = false;
  {
    const Lock held(_totals->mutex);
    while (!(taken = take(bytes, MemoryUse::working)) && !giveUp()) {
      _totals->changed.waitUntil(_totals->mutex, std::chrono::steady_clock::now() + kAskAgain);
    }
  }
  _totals->waiting.fetch_sub(1);
  if (!taken) return std::nullopt;
  return Charge(shared_from_this(), bytes, MemoryUse::working);
}

void MemoryAccount::add(const std::shared_ptr<Evictable>& evictable) {
  const Lock held(_mutex);
  std::erase_if(_evictables, [](const auto& one) { return one.expired(); });
  _evictables.push_back(evictable);
}

bool MemoryAccount::dropOldest() {
  std::vector<std::weak_ptr<Evictable>> all;
  {
    const Lock held(_mutex);
    all = _evictables;
  }
  std::shared_ptr<Evictable> oldest;
  std::uint64_t turn = 0;
  for (const auto& weak : all) {
    auto one = weak.lock();
    const auto its = one ? one->oldestTurn() : std::nullopt;
    if (!its || (oldest && *its >= turn)) continue;
    turn = *its;
    oldest = std::move(one);
  }
  if (oldest) oldest->dropOldest();
  return oldest != nullptr;
}

std::shared_ptr<MemoryAccount> MemoryBudget::accountOf(unsigned uid) {
  const Lock held(_mutex);
  if (auto account = _accounts[uid].lock()) return account;
  std::erase_if(_accounts, [uid](const auto& entry) { return entry.first != uid && entry.second.expired(); });
  auto account = std::make_shared<MemoryAccount>(uid, _totals);
  _accounts[uid] = account;
  return account;
}

}  // namespace veltrad::platform
