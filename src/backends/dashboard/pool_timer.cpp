// SPDX-License-Identifier: Apache-2.0
// A timer on Asio's steady clock.
#include "backends/dashboard/pool_timer.h"

#include <asio/io_context.hpp>
#include <asio/steady_timer.hpp>

#include "backends/dashboard/work_pool.h"

namespace veltrad::backends {

struct PoolTimer::Impl {
  explicit Impl(asio::io_context& context) : timer(context) {}
  asio::steady_timer timer;
};

std::unique_ptr<PoolTimer> PoolTimer::make(WorkPool& pool) {
  asio::io_context* const context = pool.context();
  if (!context) return nullptr;
  return std::unique_ptr<PoolTimer>(new PoolTimer(std::make_unique<Impl>(*context)));
}

PoolTimer::PoolTimer(std::unique_ptr<Impl> impl) : _impl(std::move(impl)) {}
PoolTimer::~PoolTimer() = default;

void PoolTimer::arm(std::chrono::steady_clock::time_point when, std::function<void()> handler) {
  _impl->timer.expires_at(when);
  _impl->timer.async_wait([handler = std::move(handler)](const asio::error_code& error) {
    if (!error) handler();
  });
}

}  // namespace veltrad::backends
