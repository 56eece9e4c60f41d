// The event: the flat dictionary that one message becomes. Plain functions; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "base/value.h"
#include "platform/clock.h"

namespace veltrad::backends {

class VeltraBackend;

// The sender code, "" for a client type that has none.
std::string senderCode(std::int32_t compType);

// A copy of the payload (null: empty) with the backend's fields set over it: "_startTS" (the session's start
// cut to the minute), "_sender", "_clientVersion", "_sessionID", "_eventNumber", "_method", "_status",
// "_clientTS" and "eventTime" (exact offset from the coarsened start), "_productFamily", "_productModel",
// "_osVersion", "_build",
// "_internal", "_reportVers", "_timezoneOffset" (seconds from GMT). A text that is absent leaves its field
// out.
Dictionary createEventDictfromPayload(const VeltraBackend& backend, const Dictionary* payload,
                                      platform::TimeValue timestamp, std::uint16_t method,
                                      std::uint16_t respCode, std::uint16_t eventID, int timeZoneOffset);

// On internal builds the client types 7, 11 and 13 report their numeric session ID.
bool reportsNumericSessionID(bool isInternal, std::int32_t compType);

}  // namespace veltrad::backends
