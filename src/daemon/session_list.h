// The sessions that the daemon serves. A transaction is open while there are any. Any thread.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <vector>

#include "daemon/lock_ranks.h"
#include "platform/transaction.h"
#include "session/veltrad_session.h"

namespace veltrad::daemon {

class SessionList {
 public:
  // `transaction` outlives it.
  explicit SessionList(platform::Transaction& transaction) : _transaction(transaction) {}

  void add(std::shared_ptr<session::VeltradSession> session);
  void remove(const std::shared_ptr<session::VeltradSession>& session);

  std::size_t size() const { return _size.load(std::memory_order_relaxed); }
  // The number of sessions since the start.
  std::uint64_t accepted() const { return _accepted.load(std::memory_order_relaxed); }

 private:
  platform::Transaction& _transaction;

  // Also guards opening and closing the transaction.
  Mutex _lock SESSION_LIST_LOCK;
  std::vector<std::shared_ptr<session::VeltradSession>> _sessions GUARDED_BY(_lock);

  std::atomic<std::size_t> _size{0};
  std::atomic<std::uint64_t> _accepted{0};
};

}  // namespace veltrad::daemon
