// The dashboard's datagrams: a header of 64 bytes, numbers big-endian, and a text of items " key=value". Pure
// functions; any thread.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "base/value.h"

namespace veltrad::lab {

inline constexpr std::size_t kPacketHeaderBytes = 64;
inline constexpr std::size_t kMostPacketBytes = kPacketHeaderBytes + 1023;

// Every field by its name, those that travel inverted restored, the text, and the "payload" that its items
// say. "problem" says what is wrong with the datagram; of one without a whole header there is nothing but
// "data" beside it.
Dictionary fieldsOfPacket(std::string_view datagram);
// It has a whole header, and its sender keeps it until it is acknowledged.
bool asksForAcknowledgement(std::string_view datagram);
// The header of `datagram`, which has a whole one, with its event number changed by `eventOffset`.
std::string acknowledgementOf(std::string_view datagram, std::uint16_t eventOffset = 0);

}  // namespace veltrad::lab
