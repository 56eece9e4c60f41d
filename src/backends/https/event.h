// The event: the flat dictionary that one message becomes. Plain functions; any thread.
#pragma once

#include <cstdint>
#include <string>

#include "backends/backend.h"

namespace veltrad::backends {

// The sender code, "" for a client type that has none.
std::string senderCode(std::int32_t compType);

// A copy of the message's payload with the fields of the back end, its session and the message set over it:
// "_startTS" (the session's start cut to the minute), "_sender", "_clientVersion", "_sessionID",
// "_eventNumber", "_method", "_status", "_clientTS" and "eventTime" (exact offset from the coarsened start),
// "_productFamily", "_productModel", "_osVersion", "_build", "_internal", "_reportVers", "_timezoneOffset"
// (seconds from GMT). A text that is absent leaves its field out.
Dictionary createEventDictfromPayload(const SessionFacts& facts, const std::string& productFamily,
                                      const NumberedMessage& message, int timeZoneOffset);

}  // namespace veltrad::backends
