// SPDX-License-Identifier: Apache-2.0
// The dashboard's packet as it is sent.
#pragma once

#include <cstddef>
#include <cstdint>

#include "backends/dashboard/packet_text.h"

namespace veltrad::backends {

// Numbers are big-endian. `versionMajor` is the client library's; `componentType` is the low byte of the
// client type; `timeFraction` is in units of 4 ms, `seconds` since 1970; `invertedLength` is the datagram's;
// `deviceID` is padded with NUL. Its 13 fields are those of the datagram.
struct tagReportingPacketHeader {
  std::uint8_t versionMajor;
  std::uint8_t componentType;
  std::uint8_t kind;
  std::uint8_t timeFraction;
  std::uint32_t seconds;
  std::uint32_t invertedSessionID;
  std::uint16_t invertedClientVersion;
  std::uint16_t invertedLength;
  std::uint16_t method;
  std::uint16_t respCode;
  char deviceID[40];
  std::uint16_t eventID;
  std::uint16_t flags;
};
static_assert(sizeof(tagReportingPacketHeader) == 64 && offsetof(tagReportingPacketHeader, eventID) == 60);

// The datagram is the header and the text without the terminating NUL.
struct tagReportingPacket {
  tagReportingPacketHeader header;
  char text[PacketText::kSize];
};
static_assert(sizeof(tagReportingPacket) == 1088 && offsetof(tagReportingPacket, text) == 64);

inline constexpr std::uint8_t kPacketKind = 1;
inline constexpr std::uint16_t kPacketFlagReliable = 1;
// The server was not taken from a storebag section.
inline constexpr std::uint16_t kPacketFlagNoProfile = 2;

}  // namespace veltrad::backends
