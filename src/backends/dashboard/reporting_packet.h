// The dashboard's packet, byte for byte as it travels. Plain data; any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "backends/dashboard/packet_text.h"

namespace veltrad::backends {

// Every number of more than one byte is big-endian.
struct tagReportingPacketHeader {
  std::uint8_t versionMajor;   // of the client library
  std::uint8_t componentType;  // the client type's low byte
  std::uint8_t kind;           // kPacketKind
  std::uint8_t timeFraction;   // microseconds / 4000
  std::uint32_t seconds;       // since 1970
  std::uint32_t invertedSessionID;
  std::uint16_t invertedClientVersion;
  std::uint16_t invertedLength;  // of the datagram
  std::uint16_t method;
  std::uint16_t respCode;
  char deviceID[40];  // no terminator; filled up with NUL
  std::uint16_t eventID;
  std::uint16_t flags;
};
static_assert(sizeof(tagReportingPacketHeader) == 64 && offsetof(tagReportingPacketHeader, eventID) == 60);

// The datagram is the header and the text without its NUL.
struct tagReportingPacket {
  tagReportingPacketHeader header;
  char text[PacketText::kSize];
};
static_assert(sizeof(tagReportingPacket) == 1088 && offsetof(tagReportingPacket, text) == 64);

inline constexpr std::uint8_t kPacketKind = 1;
inline constexpr std::uint16_t kPacketFlagReliable = 1;
inline constexpr std::uint16_t kPacketFlagNoProfile = 2;  // the server was not taken from a storebag section

}  // namespace veltrad::backends
