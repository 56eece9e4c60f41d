// Flushes that wait for their backends. Any thread.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/mutex.h"
#include "session/lock_ranks.h"
#include "wire/client_session_interface.h"
#include "wire/error.h"

namespace veltrad::session {

// One flush: how many backends are still to answer, and the completion while it is held.
struct PendingFlush {
  std::size_t pending = 0;
  wire::FlushReply completion;  // empty once called, or when nobody waits
};

// One lock for the flushes of all sessions; the daemon has one object.
class FlushCounters {
 public:
  std::shared_ptr<PendingFlush> begin(std::size_t backends, wire::FlushReply completion);
  // One backend has answered. The completion is called once: at the first error, or with the last answer;
  // outside the lock.
  void finished(PendingFlush& flush, const std::optional<std::string>& answer,
                const std::optional<wire::ReportingError>& error);

 private:
  Mutex _mutex FLUSH_COUNTERS_LOCK;
};

}  // namespace veltrad::session
