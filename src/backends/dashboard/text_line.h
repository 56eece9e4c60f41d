// SPDX-License-Identifier: Apache-2.0
// The dashboard text line: one packet in readable form.
#pragma once

#include <string>

#include "backends/dashboard/reporting_packet.h"

namespace veltrad::backends {

// Time, device, sender code, client version, session, event, method, response code and text. An incomplete
// character at the end of the text is left out.
std::string writeLocalLog(const tagReportingPacket& packet);

}  // namespace veltrad::backends
