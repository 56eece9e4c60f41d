// Tells when a descriptor can be read, on the shared pool. Its owner's lock guards it; handlers run on the
// pool's threads.
#pragma once

#include <functional>
#include <memory>

namespace veltrad::backends {

class WorkPool;

// Does not own the descriptor, which must stay open until the source is gone.
class ReadSource {
 public:
  // Null, where the descriptor cannot be watched.
  static std::unique_ptr<ReadSource> make(WorkPool& pool, int descriptor);
  ~ReadSource();  // a handler that was due already may still run
  ReadSource(const ReadSource&) = delete;
  ReadSource& operator=(const ReadSource&) = delete;

  // Calls `handler` once, never from here, when there is something to read or an error waits.
  void wait(std::function<void()> handler);

 private:
  struct Impl;
  explicit ReadSource(std::unique_ptr<Impl> impl);
  const std::unique_ptr<Impl> _impl;
};

}  // namespace veltrad::backends
