// SPDX-License-Identifier: Apache-2.0
// A flush that waits for the answers of its back ends. Any thread.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <utility>

#include "base/mutex.h"
#include "session/lock_ranks.h"
#include "wire/client_session_interface.h"
#include "wire/error.h"

namespace veltrad::session {

class PendingFlush {
 public:
  // So many back ends are to answer. `completion` may be empty.
  PendingFlush(std::size_t backends, wire::FlushReply completion)
      : _pending(backends), _completion(std::move(completion)) {}

  // Called when a back end has answered. Calls the completion without the lock, once: at the first error, or
  // with the last answer.
  void finished(const std::optional<std::string>& answer, const std::optional<wire::ReportingError>& error);

 private:
  Mutex _mutex PENDING_FLUSH_LOCK;
  std::size_t _pending GUARDED_BY(_mutex);
  wire::FlushReply _completion GUARDED_BY(_mutex);
};

}  // namespace veltrad::session
