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

  constexpr std::size_t kMost = 1151;
  char head[160];
  const int length = std::snprintf(head, sizeof head, "%u.%03d %s 127.0.0.1 %s %5u %5u %5u %5u %5u ",
                                   be32toh(header.seconds), header.timeFraction * 4, device,
                                   code ? code : "(null)", clientVersion, ~be32toh(header.invertedSessionID),
                                   be16toh(header.eventID), be16toh(header.method), be16toh(header.respCode));
  // Appended, because snprintf() copies a text character by character.
  std::string line(head, std::min(static_cast<std::size_t>(std::max(length, 0)), sizeof head - 1));
  line.append(packet.text, std::min(std::strlen(packet.text), kMost - line.size()));
  line.resize(withoutIncompleteEnd(line).size());
  return line;
}

}  // namespace veltrad::backends
