// SPDX-License-Identifier: Apache-2.0
// The dashboard's datagrams: a header of 64 bytes with big-endian numbers, and a text of items " key=value".
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"

namespace veltrad::tools {

inline constexpr std::size_t kPacketHeaderBytes = 64;
inline constexpr std::size_t kMostPacketBytes = kPacketHeaderBytes + 1023;

// The fields by name, with inverted ones restored, the text, and its items as "payload". "problem" says what
// is wrong with the datagram; without a whole header there is only "data" besides it.
Dictionary fieldsOfPacket(std::string_view datagram);
// The items of a text, as fieldsOfPacket() has them.
Dictionary itemsOfText(std::string_view text);
// Why the datagram is none that a daemon sends: its length or its kind; absent if it is one.
std::optional<std::string> problemOfPacket(std::string_view datagram);
// Whether it has a whole header and its sender waits for an acknowledgement.
bool asksForAcknowledgement(std::string_view datagram);
// The header of `datagram`, with its event number changed by `eventOffset`. The header must be whole.
std::string acknowledgementOf(std::string_view datagram, std::uint16_t eventOffset = 0);

}  // namespace veltrad::tools
