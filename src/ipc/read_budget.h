// What the unfinished frames of all clients together may hold. Any thread.
#pragma once

#include <atomic>
#include <cstddef>

namespace veltrad::ipc {

// One frame of the largest size and a half. A client's first 64 KiB are free: the bound on connections covers
// them.
inline constexpr std::size_t kReadBudget = 96u << 20;
inline constexpr std::size_t kReadFree = 64u << 10;

// Job: keeps clients that begin large frames and do not finish them from filling the memory. Outlives its
// users.
class ReadBudget {
 public:
  explicit ReadBudget(std::size_t bytes = kReadBudget) : _bound(bytes) {}

  // Changes what one reader holds, in bytes of its buffer, from `before` to `after`. False: more than there
  // is, and nothing has changed.
  bool change(std::size_t before, std::size_t after) {
    const std::size_t old = charged(before);
    const std::size_t wanted = charged(after);
    if (wanted <= old) {
      _held.fetch_sub(old - wanted, std::memory_order_relaxed);
      return true;
    }
    if (_held.fetch_add(wanted - old, std::memory_order_relaxed) + (wanted - old) <= _bound) return true;
    _held.fetch_sub(wanted - old, std::memory_order_relaxed);
    return false;
  }

 private:
  static std::size_t charged(std::size_t bytes) { return bytes > kReadFree ? bytes - kReadFree : 0; }

  const std::size_t _bound;
  std::atomic<std::size_t> _held{0};
};

}  // namespace veltrad::ipc
