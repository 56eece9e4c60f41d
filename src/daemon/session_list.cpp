// Adds and removes sessions.
#include "daemon/session_list.h"

namespace veltrad::daemon {

void SessionList::add(std::shared_ptr<session::VeltradSession> session) {
  const Lock held(_lock);
  if (_sessions.empty()) _transaction.open();
  _sessions.push_back(std::move(session));
  _accepted.fetch_add(1, std::memory_order_relaxed);
  _size.store(_sessions.size(), std::memory_order_relaxed);
}

void SessionList::remove(const std::shared_ptr<session::VeltradSession>& session) {
  const Lock held(_lock);
  std::erase(_sessions, session);
  _size.store(_sessions.size(), std::memory_order_relaxed);
  if (_sessions.empty()) _transaction.close();
}

}  // namespace veltrad::daemon
