// SPDX-License-Identifier: Apache-2.0
// Decides whether a failed post is kept in the spool, and whether a kept post may still leave. Pure
// functions; any thread.
#pragma once

#include <optional>
#include <string>

#include "backends/https/client_decision.h"
#include "config/storebag_content.h"
#include "http/http_client.h"
#include "wire/reasons.h"

namespace veltrad::config {
struct OwnerDecision;
}  // namespace veltrad::config

namespace veltrad::support {
struct SpoolEntry;
}  // namespace veltrad::support

namespace veltrad::backends {

// True after a transport error, too many open posts, a stop, 408, 425, 429, and 5xx except for 501 and 505.
bool isToBeKept(const http::HTTPResult& result);
// "HTTP 503", or the transport's text.
std::string outcomeOf(const http::HTTPResult& result);
// Whether the result concerns the server: a request that failed on this side does not.
bool tellsOfServer(const http::HTTPResult& result);
// How often the post was tried, with libcurl's own repeats on a kept connection. One that found no server was
// tried, too; one that the day's limit refused was not.
int triesOf(const http::HTTPResult& result);

// Whether a kept post may leave.
struct LeaveVerdict {
  // Why it may not.
  std::optional<wire::Reason> refusal;
  // Undecided at the moment, so the post waits.
  bool waits = false;

  bool mayLeave() const { return !refusal && !waits; }
};

// The owner's decision comes first.
std::optional<wire::Reason> refusalByOwner(const support::SpoolEntry& post,
                                           const config::OwnerDecision& decision);
// Then the client entry in the current section decides, or consent without a section (null). Sampling is not
// drawn again: the factor in `facts` is not used. `facts` may be null if they cannot be read at the moment; a
// post that depends on them waits.
LeaveVerdict verdictOnLeaving(const support::SpoolEntry& post, const config::OwnerDecision& decision,
                              const config::StorebagSection* section,
                              const std::optional<ClientFacts>& facts);

// The reason under which an event is counted that is dropped from the spool for `why`.
wire::Reason countedFromSpool(wire::Reason why);

}  // namespace veltrad::backends
