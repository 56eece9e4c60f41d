// SPDX-License-Identifier: Apache-2.0
// Makes the event, a flat dictionary, of a message.
#pragma once

#include <cstdint>
#include <string>

#include "backends/backend.h"

namespace veltrad::backends {

// Empty for a client type that has none.
std::string senderCode(std::int32_t compType);

// Moves the payload out of the message and returns it with these fields set: "_startTS" (the session's start,
// cut to the minute), "_sender", "_clientVersion", "_sessionID", "_eventNumber", "_method", "_status",
// "_clientTS" and "eventTime" (exact offset from the cut start), "_productFamily", "_productModel",
// "_osVersion", "_build",
// "_internal", "_reportVers", "_timezoneOffset" (seconds from GMT). A field whose text is absent is left out.
Dictionary createEventDictfromPayload(const SessionFacts& facts, const std::string& productFamily,
                                      NumberedMessage& message, int timeZoneOffset);

}  // namespace veltrad::backends
