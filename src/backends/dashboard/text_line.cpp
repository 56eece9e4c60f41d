// SPDX-License-Identifier: Apache-2.0
// Prints the fields of a packet.
#include "backends/dashboard/text_line.h"

#include <endian.h>

#include <charconv>
#include <cstring>
#include <string_view>

#include "base/text.h"
#include "config/client_types.h"

namespace veltrad::backends {

namespace {
void append(std::string& line, std::uint32_t number, std::size_t width, char fill) {
  char digits[10];
  const char* const end = std::to_chars(digits, digits + sizeof digits, number).ptr;
  const auto length = static_cast<std::size_t>(end - digits);
  if (length < width) line.append(width - length, fill);
  line.append(digits, length);
}
}  // namespace

// "%u.%03d %s 127.0.0.1 %s %5u %5u %5u %5u %5u %s", by hand, because snprintf() takes as long as the rest of
// a datagram.
std::string writeLocalLog(const tagReportingPacket& packet) {
  constexpr std::size_t kMost = 1151;
  constexpr std::size_t kHead = 160;
  const tagReportingPacketHeader& header = packet.header;
  const char* code = config::senderCodeForComponentType(header.componentType);
  const std::string_view device(header.deviceID, ::strnlen(header.deviceID, sizeof header.deviceID));
  const std::string_view text(packet.text);
  std::string line;
  line.reserve(kHead + text.size());
  append(line, be32toh(header.seconds), 0, ' ');
  line.push_back('.');
  append(line, std::uint32_t{header.timeFraction} * 4, 3, '0');
  line.append(" ").append(device).append(" 127.0.0.1 ").append(code ? code : "(null)");
  const std::uint32_t numbers[] = {static_cast<std::uint16_t>(~be16toh(header.invertedClientVersion)),
                                   ~be32toh(header.invertedSessionID), be16toh(header.eventID),
                                   be16toh(header.method), be16toh(header.respCode)};
  for (const std::uint32_t number : numbers) {
    line.push_back(' ');
    append(line, number, 5, ' ');
  }
  line.push_back(' ');
  line.append(text.substr(0, kMost - line.size()));
  line.resize(withoutIncompleteEnd(line).size());
  return line;
}

}  // namespace veltrad::backends
