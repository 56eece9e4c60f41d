// SPDX-License-Identifier: Apache-2.0
// A thread that does disk work for threads that must not wait for the disk.
#pragma once

#include <chrono>
#include <cstddef>
#include <deque>
#include <functional>
#include <list>
#include <utility>

#include "base/mutex.h"
#include "base/thread.h"

namespace veltrad::platform {

// The thread is started by start() or, if that fails, by the first job. The jobs of a queue run in order, and
// queues take turns, so that a long queue delays another one by one job at a time. Its lock is a leaf, and
// jobs run without it.
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
    // Includes the job that runs.
    std::size_t bytes = 0;
    bool runs = false;
  };
  using Lanes = std::list<Lane>;

 public:
  // The jobs of one owner. The owner counts jobs that were not accepted.
  class Queue {
   public:
    enum class Put { taken, full, noThread };

    // `writer` must outlive it. At most `most` bytes wait; a single job may have more.
    Queue(DiskWriter& writer, std::size_t most);
    // Discards the jobs that wait, and waits for one that runs.
    ~Queue();
    Queue(const Queue&) = delete;

    // Never waits. full: too many bytes wait before it. noThread: none can be started for now.
    Put put(Job job, std::size_t bytes) { return _writer.put(_lane, std::move(job), bytes); }
    // Puts a job and waits until it has run, or has failed for lack of memory. False if it is not taken, or
    // `deadline` passed first: then it may still run.
    bool run(Job job, std::chrono::steady_clock::time_point deadline);

   private:
    DiskWriter& _writer;
    const Lanes::iterator _lane;
  };

  // Its queues must have ended.
  ~DiskWriter();

  // False if no thread can be started; the first job tries again.
  bool start();
  // Waits until all jobs are done. False if `deadline` passed first.
  bool drain(std::chrono::steady_clock::time_point deadline);

 private:
  Lanes::iterator open(std::size_t most);
  void close(Lanes::iterator lane);
  Queue::Put put(Lanes::iterator lane, Job job, std::size_t bytes);
  bool startThread() REQUIRES(_mutex);
  void run();
  // The next lane in turn that has a job, which becomes the last in turn. Null if none has.
  Lane* takeTurn() REQUIRES(_mutex);
  bool busy() const REQUIRES(_mutex);

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  // Signalled to the thread, and by it.
  Condition _news;
  Condition _done;
  Lanes _lanes GUARDED_BY(_mutex);
  bool _ends GUARDED_BY(_mutex) = false;
  Thread _thread GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
