// SPDX-License-Identifier: Apache-2.0
// The sessions that the daemon serves. A transaction is open while there are any. Any thread.
#pragma once

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <vector>

#include "daemon/lock_ranks.h"
#include "session/session_delegate.h"

namespace veltrad::platform {
class Transaction;
}  // namespace veltrad::platform

namespace veltrad::daemon {

// A session as observers see it.
struct ListedSession {
  std::uint64_t number = 0;  // in the order of arrival, from 1
  session::FamilyFacts facts;
};

class SessionList {
 public:
  // `transaction` must outlive it.
  explicit SessionList(platform::Transaction& transaction) : _transaction(transaction) {}

  void add(std::shared_ptr<session::VeltradSession> session);
  void remove(const session::VeltradSession& session);
  // Updates the facts of a session; ignored for a session that is not in the list.
  void tell(session::FamilyFacts facts);

  // In the order of arrival.
  std::vector<ListedSession> all() const;
  // Without a lock.
  std::size_t size() const { return _size.load(std::memory_order_relaxed); }
  // The number of sessions since the start.
  std::uint64_t accepted() const { return _accepted.load(std::memory_order_relaxed); }

 private:
  struct Entry {
    std::shared_ptr<session::VeltradSession> session;
    ListedSession listed;
  };
  // Each session has an aggregation of its own.
  using Sessions = std::map<const session::Aggregation*, Entry>;

  platform::Transaction& _transaction;

  mutable Mutex _lock SESSION_LIST_LOCK;  // opening and closing the transaction as well
  Sessions _sessions GUARDED_BY(_lock);

  std::atomic<std::size_t> _size{0};
  std::atomic<std::uint64_t> _accepted{0};
};

}  // namespace veltrad::daemon
