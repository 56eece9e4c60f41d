// The dashboard text line: one packet for a person to read. Pure; any thread.
#pragma once

#include <string>

#include "backends/dashboard/reporting_packet.h"

namespace veltrad::backends {

// From the packet alone: time, device, sender code, client version, session, event, method, response code,
// text. A character that the packet's end cut is left out.
std::string writeLocalLog(const tagReportingPacket& packet);

}  // namespace veltrad::backends
