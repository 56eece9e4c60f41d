// SPDX-License-Identifier: Apache-2.0
// Reads datagrams and makes acknowledgements.
#include "tools/dashboard_packet.h"

#include "base/text.h"

namespace veltrad::tools {
namespace {

enum Offset : std::size_t {
  versionMajor = 0,
  componentType = 1,
  kind = 2,
  timeFraction = 3,
  seconds = 4,
  invertedSessionID = 8,
  invertedClientVersion = 12,
  invertedLength = 14,
  method = 16,
  respCode = 18,
  deviceID = 20,
  eventID = 60,
  flags = 62,
};
constexpr std::size_t kDeviceIDBytes = 40;
constexpr unsigned kMessageKind = 1;
constexpr unsigned kReliable = 1;
constexpr unsigned kNoSection = 2;

unsigned number8(std::string_view packet, Offset at) {
  return static_cast<unsigned char>(packet[at]);
}

unsigned number16(std::string_view packet, std::size_t at) {
  return static_cast<unsigned>(static_cast<unsigned char>(packet[at]) << 8 |
                               static_cast<unsigned char>(packet[at + 1]));
}

unsigned number32(std::string_view packet, std::size_t at) {
  return number16(packet, at) << 16 | number16(packet, at + 2);
}

void put16(std::string& packet, std::size_t at, unsigned number) {
  packet[at] = static_cast<char>(number >> 8 & 0xff);
  packet[at + 1] = static_cast<char>(number & 0xff);
}

std::string unescaped(std::string_view text) {
  std::string plain;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\\' && i + 1 < text.size()) ++i;
    plain += text[i];
  }
  return toUTF8(plain);
}

std::size_t nextEquals(std::string_view text, std::size_t from) {
  while (from < text.size() && text[from] != '=') from += text[from] == '\\' ? 2 : 1;
  return from < text.size() ? from : std::string_view::npos;
}

}  // namespace

// A key is the text between "=" and the last blank before it, so a key with a blank loses its beginning.
Dictionary itemsOfText(std::string_view text) {
  Dictionary items;
  std::size_t equals = nextEquals(text, 0);
  std::size_t key = equals == std::string_view::npos ? 0 : text.rfind(' ', equals) + 1;
  while (equals != std::string_view::npos) {
    const std::size_t next = nextEquals(text, equals + 1);
    const std::size_t blank = next == std::string_view::npos ? text.size() : text.rfind(' ', next);
    // Without a blank the "=" is part of a key, and the item continues.
    const std::size_t end = blank > equals && blank != std::string_view::npos ? blank : text.size();
    items.set(toUTF8(text.substr(key, equals - key)), unescaped(text.substr(equals + 1, end - equals - 1)));
    if (end == text.size()) break;
    key = end + 1;
    equals = next;
  }
  return items;
}

std::optional<std::string> problemOfPacket(std::string_view datagram) {
  if (datagram.size() < kPacketHeaderBytes) return "shorter than the header of 64 bytes";
  if (datagram.size() > kMostPacketBytes) return "longer than " + std::to_string(kMostPacketBytes) + " bytes";
  const unsigned length = ~number16(datagram, invertedLength) & 0xffff;
  if (length != datagram.size())
    return "says that it has " + std::to_string(length) + " bytes, has " + std::to_string(datagram.size());
  if (number8(datagram, kind) != kMessageKind) return "its kind is not 1";
  return std::nullopt;
}

Dictionary fieldsOfPacket(std::string_view datagram) {
  if (datagram.size() < kPacketHeaderBytes)
    return {{"data", Data{std::string(datagram)}}, {"problem", *problemOfPacket(datagram)}};
  const std::string_view device = datagram.substr(deviceID, kDeviceIDBytes);
  const std::string_view text = datagram.substr(kPacketHeaderBytes);
  const unsigned flagBits = number16(datagram, flags);
  Dictionary fields{
      {"versionMajor", number8(datagram, versionMajor)},
      {"componentType", number8(datagram, componentType)},
      {"kind", number8(datagram, kind)},
      {"timeFraction", number8(datagram, timeFraction)},
      {"seconds", number32(datagram, seconds)},
      {"sessionID", ~number32(datagram, invertedSessionID)},
      {"clientVersion", ~number16(datagram, invertedClientVersion) & 0xffff},
      {"length", ~number16(datagram, invertedLength) & 0xffff},
      {"method", number16(datagram, method)},
      {"respCode", number16(datagram, respCode)},
      {"deviceID", toUTF8(device.substr(0, device.find('\0')))},
      {"eventID", number16(datagram, eventID)},
      {"flags", flagBits},
      {"reliable", (flagBits & kReliable) != 0},
      {"withoutSection", (flagBits & kNoSection) != 0},
      {"text", toUTF8(text)},
      {"payload", itemsOfText(text)},
  };
  if (const auto problem = problemOfPacket(datagram))
    fields.set("problem", *problem);
  else if (text.find('\0') != std::string_view::npos)
    fields.set("problem", "a NUL in its text");
  return fields;
}

bool asksForAcknowledgement(std::string_view datagram) {
  return datagram.size() >= kPacketHeaderBytes && (number16(datagram, flags) & kReliable) != 0;
}

std::string acknowledgementOf(std::string_view datagram, std::uint16_t eventOffset) {
  std::string header(datagram.substr(0, kPacketHeaderBytes));
  put16(header, eventID, number16(datagram, eventID) + eventOffset);
  put16(header, invertedLength, ~static_cast<unsigned>(kPacketHeaderBytes));
  return header;
}

}  // namespace veltrad::tools
