// SPDX-License-Identifier: Apache-2.0
// Counts the answers to a flush.
#include "session/pending_flush.h"

namespace veltrad::session {

void PendingFlush::finished(const std::optional<std::string>& answer,
                            const std::optional<wire::ReportingError>& error) {
  wire::FlushReply completion;
  {
    const Lock held(_mutex);
    if (_pending > 0) --_pending;
    if (error || _pending == 0) completion.swap(_completion);
  }
  if (completion) completion(answer, error);
}

}  // namespace veltrad::session
