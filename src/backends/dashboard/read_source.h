// SPDX-License-Identifier: Apache-2.0
// Waits on the shared pool until a descriptor can be read. Its owner's lock guards it.
#pragma once

#include <functional>
#include <memory>

namespace veltrad::backends {

class WorkPool;

// Does not own the descriptor, which must stay open until the source is destroyed.
class ReadSource {
 public:
  // Null if the descriptor cannot be watched.
  static std::unique_ptr<ReadSource> make(WorkPool& pool, int descriptor);
  // A handler that was due already may still run.
  ~ReadSource();

  // Calls `handler` once, on a thread of the pool, when there is something to read or an error.
  void wait(std::function<void()> handler);

 private:
  struct Impl;
  explicit ReadSource(std::unique_ptr<Impl> impl);
  const std::unique_ptr<Impl> _impl;
};

}  // namespace veltrad::backends
