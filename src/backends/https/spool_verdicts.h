// SPDX-License-Identifier: Apache-2.0
// Whether a post that has ended so is kept in the spool, and whether a kept one may still leave. Values to
// verdicts; any thread.
#pragma once

#include <optional>
#include <string>

#include "backends/https/client_decision.h"
#include "config/storebag_content.h"
#include "http/http_client.h"
#include "wire/reasons.h"

namespace veltrad::config {
struct OwnersWord;
}  // namespace veltrad::config

namespace veltrad::support {
struct SpoolEntry;
}  // namespace veltrad::support

namespace veltrad::backends {

// After a transport error, too many posts under way, a stop, 408, 425, 429, and 5xx but for 501 and 505.
bool isToBeKept(const http::HTTPResult& result);
// "HTTP 503", or the transport's text.
std::string outcomeOf(const http::HTTPResult& result);
// Whether it says anything of the server: what this end could not begin, or gave up, does not.
bool tellsOfServer(const http::HTTPResult& result);
// How often the post was tried, with libcurl's own repeats on a kept connection. One that found no server was
// tried, too; one that the day's limit refused was not.
int triesOf(const http::HTTPResult& result);

// Whether a kept post may leave.
struct LeaveVerdict {
  // Why it may not.
  std::optional<wire::Reason> refusal;
  // It cannot be told just now, and the post waits.
  bool waits = false;

  bool mayLeave() const { return !refusal && !waits; }
};

// The owner's word stands above all.
std::optional<wire::Reason> refusalByOwner(const support::SpoolEntry& post, const config::OwnersWord& word);
// Then decides the client entry of the section that is in force, or, without a section (null), consent.
// Sampling is not drawn anew, and of `facts` the factor is not used. Without `facts`, which cannot be read
// just now, a post waits if they decide.
LeaveVerdict verdictOnLeaving(const support::SpoolEntry& post, const config::OwnersWord& word,
                              const config::StorebagSection* section,
                              const std::optional<ClientFacts>& facts);

// Under which an event is counted that leaves the spool unsent for this reason.
wire::Reason countedFromSpool(wire::Reason why);

}  // namespace veltrad::backends
