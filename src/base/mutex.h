// SPDX-License-Identifier: Apache-2.0
// Mutexes with annotations for Clang's thread safety analysis and, in debug builds, a check of the lock
// order.
#pragma once

#include <condition_variable>
#include <mutex>

#if defined(__clang__)
#define VELTRA_ANNOTATE(x) __attribute__((x))
#else
#define VELTRA_ANNOTATE(x)
#endif

#define CAPABILITY(name) VELTRA_ANNOTATE(capability(name))
#define SCOPED_CAPABILITY VELTRA_ANNOTATE(scoped_lockable)
#define GUARDED_BY(m) VELTRA_ANNOTATE(guarded_by(m))
#define ACQUIRED_BEFORE(...) VELTRA_ANNOTATE(acquired_before(__VA_ARGS__))
#define ACQUIRED_AFTER(...) VELTRA_ANNOTATE(acquired_after(__VA_ARGS__))
#define REQUIRES(...) VELTRA_ANNOTATE(requires_capability(__VA_ARGS__))
#define EXCLUDES(...) VELTRA_ANNOTATE(locks_excluded(__VA_ARGS__))
#define ACQUIRE(...) VELTRA_ANNOTATE(acquire_capability(__VA_ARGS__))
#define RELEASE(...) VELTRA_ANNOTATE(release_capability(__VA_ARGS__))
#define TRY_ACQUIRE(...) VELTRA_ANNOTATE(try_acquire_capability(__VA_ARGS__))
#define NO_THREAD_SAFETY_ANALYSIS VELTRA_ANNOTATE(no_thread_safety_analysis)

namespace veltrad {

// The place of a lock in the order: a thread may take only locks of a higher rank than any it holds. Ranks
// are numbers; the room that owns a lock names its rank. While a leaf is held, only locks above `leaf` may be
// taken.
enum class LockRank : int { leaf = 100 };

// The same order for the compiler: a lock whose rank is a multiple of ten lies between two levels, and a leaf
// lies above all levels. Clang's -Wthread-safety-beta then refuses a function that takes two locks in the
// wrong order.
namespace lock_order {
class CAPABILITY("lock level") Level {};
inline Level above0;
#define LOCK_LEVELS(rank, last)                         \
  inline Level below##rank ACQUIRED_AFTER(above##last); \
  inline Level above##rank ACQUIRED_AFTER(below##rank)
LOCK_LEVELS(10, 0);
LOCK_LEVELS(20, 10);
LOCK_LEVELS(30, 20);
LOCK_LEVELS(40, 30);
LOCK_LEVELS(50, 40);
LOCK_LEVELS(60, 50);
#undef LOCK_LEVELS

// In debug builds, taking() aborts with both ranks if `rank` may not be taken now.
void taking(LockRank rank);
void released(LockRank rank);
}  // namespace lock_order

// To be written after the name of a lock: `Mutex _mutex LOCK_OF_RANK(20);`, `Mutex _mutex
// LEAF_LOCK{LockRank::leaf};`.
#define LOCK_OF_RANK(rank)                              \
  ACQUIRED_AFTER(::veltrad::lock_order::below##rank)    \
  ACQUIRED_BEFORE(::veltrad::lock_order::above##rank) { \
    static_cast<::veltrad::LockRank>(rank)              \
  }
#define LEAF_LOCK ACQUIRED_AFTER(::veltrad::lock_order::above60)

class CAPABILITY("mutex") Mutex {
 public:
  explicit Mutex(LockRank rank) : _rank(rank) {}

  void lock() ACQUIRE() {
#ifndef NDEBUG
    lock_order::taking(_rank);
#endif
    _mutex.lock();
  }
  // Does not wait. Takes part in the lock order like lock().
  bool tryLock() TRY_ACQUIRE(true) {
    const bool got = _mutex.try_lock();
#ifndef NDEBUG
    if (got) lock_order::taking(_rank);
#endif
    return got;
  }
  void unlock() RELEASE() {
    _mutex.unlock();
#ifndef NDEBUG
    lock_order::released(_rank);
#endif
  }

 private:
  friend class Condition;
  std::mutex _mutex;
  [[maybe_unused]] const LockRank _rank;
};

class SCOPED_CAPABILITY Lock {
 public:
  explicit Lock(Mutex& mutex) ACQUIRE(mutex) : _mutex(mutex) { _mutex.lock(); }
  ~Lock() RELEASE() { _mutex.unlock(); }
  Lock(const Lock&) = delete;

 private:
  Mutex& _mutex;
};

// A condition variable for Mutex. Wake-ups may be spurious: wait in a loop that checks the condition.
class Condition {
 public:
  void wait(Mutex& mutex) REQUIRES(mutex) {
    std::unique_lock<std::mutex> held(mutex._mutex, std::adopt_lock);
    _condition.wait(held);
    held.release();
  }
  // False if `deadline` passed first.
  template <typename TimePoint>
  bool waitUntil(Mutex& mutex, TimePoint deadline) REQUIRES(mutex) {
    std::unique_lock<std::mutex> held(mutex._mutex, std::adopt_lock);
    const bool notified = _condition.wait_until(held, deadline) == std::cv_status::no_timeout;
    held.release();
    return notified;
  }
  void notifyOne() { _condition.notify_one(); }
  void notifyAll() { _condition.notify_all(); }

 private:
  std::condition_variable _condition;
};

}  // namespace veltrad
