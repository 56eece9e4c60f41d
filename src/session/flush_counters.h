// SPDX-License-Identifier: Apache-2.0
// Flushes that wait for the answers of their back ends. Any thread.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/mutex.h"
#include "session/lock_ranks.h"
#include "wire/client_session_interface.h"
#include "wire/error.h"

namespace veltrad::session {

// How many back ends have not answered yet, and the completion until it is called.
struct PendingFlush {
  std::size_t pending = 0;
  wire::FlushReply completion;
};

// One object serves all sessions.
class FlushCounters {
 public:
  std::shared_ptr<PendingFlush> begin(std::size_t backends, wire::FlushReply completion);
  // Called when a back end has answered. Calls the completion without the lock, once: at the first error, or
  // with the last answer.
  void finished(PendingFlush& flush, const std::optional<std::string>& answer,
                const std::optional<wire::ReportingError>& error);

 private:
  Mutex _mutex FLUSH_COUNTERS_LOCK;
};

}  // namespace veltrad::session
