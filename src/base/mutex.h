// Mutexes that the compiler checks: annotated for Clang's thread safety analysis, ranked at run time in debug
// builds. Any thread.
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
#define PT_GUARDED_BY(m) VELTRA_ANNOTATE(pt_guarded_by(m))
#define ACQUIRED_BEFORE(...) VELTRA_ANNOTATE(acquired_before(__VA_ARGS__))
#define ACQUIRED_AFTER(...) VELTRA_ANNOTATE(acquired_after(__VA_ARGS__))
#define REQUIRES(...) VELTRA_ANNOTATE(requires_capability(__VA_ARGS__))
#define EXCLUDES(...) VELTRA_ANNOTATE(locks_excluded(__VA_ARGS__))
#define ACQUIRE(...) VELTRA_ANNOTATE(acquire_capability(__VA_ARGS__))
#define RELEASE(...) VELTRA_ANNOTATE(release_capability(__VA_ARGS__))
#define RETURN_CAPABILITY(m) VELTRA_ANNOTATE(lock_returned(m))
#define NO_THREAD_SAFETY_ANALYSIS VELTRA_ANNOTATE(no_thread_safety_analysis)

namespace veltrad {

// The place of a lock in the order: a thread takes only locks of a higher rank than the highest it holds.
// Leaves have the highest rank and take nothing further.
enum class LockRank : int {
  sessionList = 10,
  storebagCache = 15,
  families = 20,
  flushCounters = 30,
  session = 40,
  backend = 50,
  leaf = 100,
  memory = 102,  // of those who wait for memory, which is paid back under any lock
};

// The same order for the compiler: each level stands between two ranks, and a lock of a rank says on which
// side of them it lies. Clang's -Wthread-safety-beta then refuses a function that takes two locks in the
// wrong order.
namespace lock_order {
class CAPABILITY("lock level") Level {};
inline Level belowSessionList;
inline Level belowStorebagCache ACQUIRED_AFTER(belowSessionList);
inline Level belowFamilies ACQUIRED_AFTER(belowStorebagCache);
inline Level belowFlushCounters ACQUIRED_AFTER(belowFamilies);
inline Level belowSession ACQUIRED_AFTER(belowFlushCounters);
inline Level belowBackend ACQUIRED_AFTER(belowSession);
}  // namespace lock_order
#define SESSION_LIST_LOCK ACQUIRED_BEFORE(::veltrad::lock_order::belowSessionList)
#define STOREBAG_CACHE_LOCK                               \
  ACQUIRED_AFTER(::veltrad::lock_order::belowSessionList) \
  ACQUIRED_BEFORE(::veltrad::lock_order::belowStorebagCache)
#define FAMILIES_LOCK                                       \
  ACQUIRED_AFTER(::veltrad::lock_order::belowStorebagCache) \
  ACQUIRED_BEFORE(::veltrad::lock_order::belowFamilies)
#define FLUSH_COUNTERS_LOCK                            \
  ACQUIRED_AFTER(::veltrad::lock_order::belowFamilies) \
  ACQUIRED_BEFORE(::veltrad::lock_order::belowFlushCounters)
#define SESSION_LOCK                                        \
  ACQUIRED_AFTER(::veltrad::lock_order::belowFlushCounters) \
  ACQUIRED_BEFORE(::veltrad::lock_order::belowSession)
#define BACKEND_LOCK \
  ACQUIRED_AFTER(::veltrad::lock_order::belowSession) ACQUIRED_BEFORE(::veltrad::lock_order::belowBackend)
#define LEAF_LOCK ACQUIRED_AFTER(::veltrad::lock_order::belowBackend)

namespace lock_order {
// Debug builds: aborts with both ranks when `rank` may not be taken now. Release builds: nothing.
void taking(LockRank rank);
void released(LockRank rank);
}  // namespace lock_order

class CAPABILITY("mutex") Mutex {
 public:
  explicit Mutex(LockRank rank) : _rank(rank) {}
  Mutex(const Mutex&) = delete;
  Mutex& operator=(const Mutex&) = delete;

  void lock() ACQUIRE() {
#ifndef NDEBUG
    lock_order::taking(_rank);
#endif
    _mutex.lock();
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
  [[maybe_unused]] const LockRank _rank;  // of use in debug builds alone
};

class SCOPED_CAPABILITY Lock {
 public:
  explicit Lock(Mutex& mutex) ACQUIRE(mutex) : _mutex(mutex) { _mutex.lock(); }
  ~Lock() RELEASE() { _mutex.unlock(); }
  Lock(const Lock&) = delete;
  Lock& operator=(const Lock&) = delete;

 private:
  Mutex& _mutex;
};

// Waits for a condition under a Mutex; always in a loop around the condition, or with wait_until's predicate.
class Condition {
 public:
  void wait(Mutex& mutex) REQUIRES(mutex) {
    std::unique_lock<std::mutex> held(mutex._mutex, std::adopt_lock);
    _condition.wait(held);
    held.release();
  }
  // False when `deadline` passed first.
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
