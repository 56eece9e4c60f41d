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
// Ranks are numbers; the room that owns a lock gives its rank a name. Leaves take nothing further, but for
// those of a rank above theirs.
enum class LockRank : int { leaf = 100 };

// The same order for the compiler: two levels stand around each multiple of ten, and a lock of that rank lies
// between them, a leaf above them all. Clang's -Wthread-safety-beta then refuses a function that takes two
// locks in the wrong order.
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
}  // namespace lock_order

// Behind the name of a lock: `Mutex _mutex LOCK_OF_RANK(20);` and `Mutex _mutex LEAF_LOCK{LockRank::leaf};`.
#define LOCK_OF_RANK(rank)                              \
  ACQUIRED_AFTER(::veltrad::lock_order::below##rank)    \
  ACQUIRED_BEFORE(::veltrad::lock_order::above##rank) { \
    static_cast<::veltrad::LockRank>(rank)              \
  }
#define LEAF_LOCK ACQUIRED_AFTER(::veltrad::lock_order::above60)

namespace lock_order {
// Debug builds: aborts with both ranks when `rank` may not be taken now. Release builds: nothing.
void taking(LockRank rank, bool recursive);
void released(LockRank rank);
}  // namespace lock_order

class CAPABILITY("mutex") Mutex {
 public:
  explicit Mutex(LockRank rank) : _rank(rank) {}
  Mutex(const Mutex&) = delete;
  Mutex& operator=(const Mutex&) = delete;

  void lock() ACQUIRE() {
#ifndef NDEBUG
    lock_order::taking(_rank, false);
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

// The same thread may take it again. Analysed like a Mutex: a function that may hold it already says so with
// REQUIRES and does not take it.
class CAPABILITY("mutex") RecursiveMutex {
 public:
  explicit RecursiveMutex(LockRank rank) : _rank(rank) {}
  RecursiveMutex(const RecursiveMutex&) = delete;
  RecursiveMutex& operator=(const RecursiveMutex&) = delete;

  void lock() ACQUIRE() {
#ifndef NDEBUG
    lock_order::taking(_rank, true);
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
  std::recursive_mutex _mutex;
  [[maybe_unused]] const LockRank _rank;  // of use in debug builds alone
};

template <typename M>
class SCOPED_CAPABILITY Lock {
 public:
  explicit Lock(M& mutex) ACQUIRE(mutex) : _mutex(mutex) { _mutex.lock(); }
  ~Lock() RELEASE() { _mutex.unlock(); }
  Lock(const Lock&) = delete;
  Lock& operator=(const Lock&) = delete;

 private:
  M& _mutex;
};
template <typename M>
Lock(M&) -> Lock<M>;

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

// The same for a RecursiveMutex that the thread holds exactly once; always in a loop around the condition.
class RecursiveCondition {
 public:
  void wait(RecursiveMutex& mutex) REQUIRES(mutex) { _condition.wait(mutex); }
  void notifyAll() { _condition.notify_all(); }

 private:
  std::condition_variable_any _condition;
};

}  // namespace veltrad
