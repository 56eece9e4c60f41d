// SPDX-License-Identifier: Apache-2.0
// Counts the answers to flushes.
#include "session/flush_counters.h"

namespace veltrad::session {

std::shared_ptr<PendingFlush> FlushCounters::begin(std::size_t backends, wire::FlushReply completion) {
  auto flush = std::make_shared<PendingFlush>();
  flush->pending = backends;
  flush->completion = std::move(completion);
  return flush;
}

void FlushCounters::finished(PendingFlush& flush, const std::optional<std::string>& answer,
                             const std::optional<wire::ReportingError>& error) {
  wire::FlushReply completion;
  {
    const Lock held(_mutex);
    if (flush.pending > 0) --flush.pending;
    if (error || flush.pending == 0) completion.swap(flush.completion);
  }
  if (completion) completion(answer, error);
}

}  // namespace veltrad::session
