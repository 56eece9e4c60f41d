// SPDX-License-Identifier: Apache-2.0
// Limits the memory of all bodies together.
#pragma once

#include <atomic>
#include <cstdint>

namespace veltrad::gateway {

// Any thread.
class ByteBudget {
 public:
  explicit ByteBudget(std::uint64_t most) : _most(most) {}

 private:
  friend class Charge;
  bool take(std::uint64_t bytes);
  void give(std::uint64_t bytes) { _taken.fetch_sub(bytes, std::memory_order_relaxed); }

  const std::uint64_t _most;
  std::atomic<std::uint64_t> _taken{0};
};

// The part of a budget that one body uses; the destructor returns it. The budget must outlive it. One thread
// at a time.
class Charge {
 public:
  explicit Charge(ByteBudget& budget) : _budget(&budget) {}
  Charge(Charge&& other) noexcept;
  Charge& operator=(Charge&&) = delete;
  ~Charge() { _budget->give(_bytes); }

  // Keeps so many bytes in place of what it kept. False: there is no room, and nothing has changed.
  bool to(std::uint64_t bytes);
  std::uint64_t bytes() const { return _bytes; }

 private:
  ByteBudget* const _budget;
  std::uint64_t _bytes = 0;
};

}  // namespace veltrad::gateway
