// SPDX-License-Identifier: Apache-2.0
// Prints the fields of a packet.
#include "backends/dashboard/text_line.h"

#include <endian.h>

#include <algorithm>
#include <cstdio>
#include <cstring>

#include "base/text.h"
#include "config/client_types.h"

namespace veltrad::backends {

std::string writeLocalLog(const tagReportingPacket& packet) {
  const tagReportingPacketHeader& header = packet.header;
  char device[sizeof header.deviceID + 1] = {};
  std::memcpy(device, header.deviceID, sizeof header.deviceID);
  const char* code = config::senderCodeForComponentType(header.componentType);
  const auto clientVersion = static_cast<std::uint16_t>(~be16toh(header.invertedClientVersion));

  char line[1152];
  const int length =
      std::snprintf(line, sizeof line, "%u.%03d %s 127.0.0.1 %s %5u %5u %5u %5u %5u %s",
                    be32toh(header.seconds), header.timeFraction * 4, device, code ? code : "(null)",
                    clientVersion, ~be32toh(header.invertedSessionID), be16toh(header.eventID),
                    be16toh(header.method), be16toh(header.respCode), packet.text);
  const auto written = std::min(static_cast<std::size_t>(std::max(length, 0)), sizeof line - 1);
  return std::string(withoutIncompleteEnd({line, written}));
}

}  // namespace veltrad::backends
