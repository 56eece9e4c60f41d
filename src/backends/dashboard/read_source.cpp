// SPDX-License-Identifier: Apache-2.0
// Waits with Asio's reactor.
#include "backends/dashboard/read_source.h"

#include <asio/io_context.hpp>
#include <asio/posix/stream_descriptor.hpp>

#include "backends/dashboard/work_pool.h"

namespace veltrad::backends {

struct ReadSource::Impl {
  explicit Impl(asio::io_context& context) : descriptor(context) {}
  ~Impl() { descriptor.release(); }
  asio::posix::stream_descriptor descriptor;
};

std::unique_ptr<ReadSource> ReadSource::make(WorkPool& pool, int descriptor) {
  asio::io_context* const context = pool.context();
  if (!context) return nullptr;
  auto impl = std::make_unique<Impl>(*context);
  asio::error_code error;
  impl->descriptor.assign(descriptor, error);
  if (error) return nullptr;
  return std::unique_ptr<ReadSource>(new ReadSource(std::move(impl)));
}

ReadSource::ReadSource(std::unique_ptr<Impl> impl) : _impl(std::move(impl)) {}
ReadSource::~ReadSource() = default;

void ReadSource::wait(std::function<void()> handler) {
  _impl->descriptor.async_wait(asio::posix::stream_descriptor::wait_read,
                               [handler = std::move(handler)](const asio::error_code& error) {
                                 if (!error) handler();
                               });
}

}  // namespace veltrad::backends
