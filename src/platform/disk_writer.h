// One thread that touches the disk for those who must not wait for it. Any thread.
#pragma once

#include <chrono>
#include <cstddef>
#include <deque>
#include <functional>
#include <list>
#include <thread>
#include <utility>

#include "base/mutex.h"

namespace veltrad::platform {

// The thread starts with start(), or where none could be had then, with the first job. Jobs of one queue run
// in order, queues take turns, so that a long one holds up another by one job at a time. Its lock is a leaf,
// and no job runs under it.
class DiskWriter {
 public:
  using Job = std::function<void()>;

 private:
  struct Waiting {
    Job job;
    std::size_t bytes = 0;
  };
  struct Lane {
    std::size_t most;
    std::deque<Waiting> waiting;
    std::size_t bytes = 0;  // with the job that runs
    bool runs = false;
  };
  using Lanes = std::list<Lane>;

 public:
  // One kind of what is written; its owner counts what is not taken.
  class Queue {
   public:
    enum class Put { taken, full, noThread };

    // `writer` outlives it. `most`: bytes that wait; a single job may have more.
    Queue(DiskWriter& writer, std::size_t most);
    // What waits is thrown away; a job that runs is waited for.
    ~Queue();
    Queue(const Queue&) = delete;
    Queue& operator=(const Queue&) = delete;

    // Never waits. full: others wait before it; noThread: none can be started now, which may pass.
    Put put(Job job, std::size_t bytes) { return _writer.put(_lane, std::move(job), bytes); }

   private:
    DiskWriter& _writer;
    const Lanes::iterator _lane;
  };

  DiskWriter() = default;
  // After its queues.
  ~DiskWriter();
  DiskWriter(const DiskWriter&) = delete;
  DiskWriter& operator=(const DiskWriter&) = delete;

  // False: no thread could be had; the first job tries again.
  bool start();
  // Waits until everything is written, at most until `deadline`; false: not everything is.
  bool drain(std::chrono::steady_clock::time_point deadline);

 private:
  Lanes::iterator open(std::size_t most);
  void close(Lanes::iterator lane);
  Queue::Put put(Lanes::iterator lane, Job job, std::size_t bytes);
  bool startThread() REQUIRES(_mutex);
  void run();
  // The next in turn that has a job, from now on the last in turn; null: none has.
  Lane* takeTurn() REQUIRES(_mutex);
  bool busy() const REQUIRES(_mutex);

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _news;  // for the thread
  Condition _done;  // for those who wait for it
  Lanes _lanes GUARDED_BY(_mutex);
  bool _ends GUARDED_BY(_mutex) = false;
  std::thread _thread GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
