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

// Why a post may not leave any more; nothing: it may. The owner's word stands above all; then decides the
// client entry of the section that is in force, or, without a section, consent. Sampling is not drawn anew.
// Of `facts`, the sampling factor is not used. `section` may be null.
std::optional<wire::Reason> refusalToLeave(const support::SpoolEntry& post, const config::OwnersWord& word,
                                           const config::StorebagSection* section, const ClientFacts& facts);

// Under which an event is counted that leaves the spool unsent for this reason.
wire::Reason countedFromSpool(wire::Reason why);

}  // namespace veltrad::backends
