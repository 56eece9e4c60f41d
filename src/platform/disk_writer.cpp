// SPDX-License-Identifier: Apache-2.0
// Queues of jobs, and the thread that runs them in turn.
#include "platform/disk_writer.h"

#include <algorithm>
#include <future>
#include <memory>
#include <new>

#include "platform/log.h"

namespace veltrad::platform {

DiskWriter::Queue::Queue(DiskWriter& writer, std::size_t most) : _writer(writer), _lane(writer.open(most)) {}

DiskWriter::Queue::~Queue() {
  _writer.close(_lane);
}

bool DiskWriter::Queue::run(Job job, std::chrono::steady_clock::time_point deadline) {
  const auto done = std::make_shared<std::promise<void>>();  // the job's, because it may outlive this call
  const auto ran = done->get_future();
  const auto whole = [job = std::move(job), done] {
    try {
      job();
    } catch (const std::bad_alloc&) {  // what it left is its owner's
    }
    done->set_value();
  };
  return put(whole, 1) == Put::taken && ran.wait_until(deadline) == std::future_status::ready;
}

DiskWriter::Lanes::iterator DiskWriter::open(std::size_t most) {
  const Lock held(_mutex);
  return _lanes.insert(_lanes.end(), Lane{most, {}});
}

void DiskWriter::close(Lanes::iterator lane) {
  Lanes closed;  // its jobs are destroyed after the lock was released
  const Lock held(_mutex);
  while (lane->runs) _done.wait(_mutex);
  closed.splice(closed.end(), _lanes, lane);
}

DiskWriter::Queue::Put DiskWriter::put(Lanes::iterator lane, Job job, std::size_t bytes) {
  const Lock held(_mutex);
  if (lane->bytes > 0 && (bytes > lane->most || lane->bytes > lane->most - bytes)) return Queue::Put::full;
  if (!startThread()) return Queue::Put::noThread;
  try {
    lane->waiting.push_back({std::move(job), bytes});
  } catch (const std::bad_alloc&) {
    return Queue::Put::full;
  }
  lane->bytes += bytes;
  _news.notifyOne();
  return Queue::Put::taken;
}

DiskWriter::~DiskWriter() {
  Thread thread;
  {
    const Lock held(_mutex);
    _ends = true;
    _news.notifyOne();
    thread = std::move(_thread);
  }
  thread.join();
}

bool DiskWriter::start() {
  const Lock held(_mutex);
  return startThread();
}

bool DiskWriter::startThread() {
  return _thread.running() || _thread.start("disk", kConnectionStackBytes, [this] { run(); });
}

DiskWriter::Lane* DiskWriter::takeTurn() {
  const auto lane =
      std::find_if(_lanes.begin(), _lanes.end(), [](const Lane& one) { return !one.waiting.empty(); });
  if (lane == _lanes.end()) return nullptr;
  _lanes.splice(_lanes.end(), _lanes, lane);
  return &*lane;
}

void DiskWriter::run() {
  Lane* lane = nullptr;
  Waiting next;
  for (;;) {
    {
      const Lock held(_mutex);
      if (lane) {
        lane->bytes -= next.bytes;
        lane->runs = false;
        _done.notifyAll();
      }
      while (!(lane = takeTurn())) {
        if (_ends) return;
        _news.wait(_mutex);
      }
      lane->runs = true;
      next = std::move(lane->waiting.front());
      lane->waiting.pop_front();
    }
    try {
      next.job();
    } catch (const std::bad_alloc&) {
      logError("DiskWriter(run): no memory to write with");
    }
    next.job = nullptr;
  }
}

bool DiskWriter::busy() const {
  return std::any_of(_lanes.begin(), _lanes.end(),
                     [](const Lane& lane) { return lane.runs || !lane.waiting.empty(); });
}

bool DiskWriter::drain(std::chrono::steady_clock::time_point deadline) {
  const Lock held(_mutex);
  while (busy()) {
    if (!_done.waitUntil(_mutex, deadline)) return !busy();
  }
  return true;
}

}  // namespace veltrad::platform
