// SPDX-License-Identifier: Apache-2.0
// The shared pool, on Asio.
#include "backends/dashboard/work_pool.h"

#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>
#include <new>
#include <optional>
#include <system_error>
#include <thread>
#include <vector>

#include "base/mutex.h"
#include "platform/log.h"

namespace veltrad::backends {

namespace {
constexpr int kThreads = 2;
}

struct WorkPool::Impl {
  void start() REQUIRES(mutex) {
    try {
      context = std::make_unique<asio::io_context>(kThreads);
      guard.emplace(context->get_executor());
      while (threads.size() < kThreads) {
        threads.emplace_back([this, running = context.get()] { run(*running); });
        ++alive;
      }
    } catch (const std::system_error& error) {
      logError("The work pool cannot be started: %s", error.what());
      if (!threads.empty()) return;  // one thread is enough
      guard.reset();
      context.reset();
    }
  }
  // False if a handler had no memory; the others go on.
  static bool runs(asio::io_context& running) {
    try {
      running.run();
      return true;
    } catch (const std::bad_alloc&) {
      return false;
    }
  }
  void run(asio::io_context& running) {
    while (!runs(running)) {
    }
    const Lock held(mutex);
    --alive;
    ended.notifyAll();
  }

  Mutex mutex LEAF_LOCK{LockRank::leaf};
  Condition ended;
  std::unique_ptr<asio::io_context> context GUARDED_BY(mutex);
  std::optional<asio::executor_work_guard<asio::io_context::executor_type>> guard GUARDED_BY(mutex);
  std::vector<std::thread> threads GUARDED_BY(mutex);
  std::size_t alive GUARDED_BY(mutex) = 0;
};

WorkPool::WorkPool() : _impl(std::make_unique<Impl>()) {}

WorkPool::~WorkPool() {
  drain(std::chrono::steady_clock::now());
  discard();
}

asio::io_context* WorkPool::context() {
  const Lock held(_impl->mutex);
  if (!_impl->context) _impl->start();
  return _impl->context.get();
}

void WorkPool::drain(std::chrono::steady_clock::time_point deadline) {
  std::vector<std::thread> threads;
  {
    const Lock held(_impl->mutex);
    if (!_impl->context) return;
    _impl->guard.reset();
    while (_impl->alive > 0 && _impl->ended.waitUntil(_impl->mutex, deadline)) {
    }
    _impl->context->stop();
    threads.swap(_impl->threads);
  }
  for (std::thread& thread : threads) thread.join();
}

void WorkPool::discard() {
  // Destroyed without the lock, because handlers own objects that take locks.
  std::unique_ptr<asio::io_context> context;
  {
    const Lock held(_impl->mutex);
    context.swap(_impl->context);
  }
}

}  // namespace veltrad::backends
