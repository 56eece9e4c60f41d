// SPDX-License-Identifier: Apache-2.0
// Unpacks and formats bodies.
#include "tools/ctl/readable_body.h"

#include <fmt/format.h>
#include <zlib.h>

#include <array>
#include <optional>

#include "base/property_list.h"
#include "base/text.h"
#include "formats/json.h"

namespace veltrad::ctl {

namespace {

constexpr std::size_t kMostUnpacked = 64u << 20;
constexpr std::size_t kMostHex = 512;
constexpr std::size_t kDatagramHeader = 64;

// Nothing: it is no gzip, or too much.
std::optional<std::string> unpacked(std::string_view body) {
  constexpr int kGzipAlone = 16 + MAX_WBITS;
  z_stream stream{};
  if (!body.starts_with("\x1f\x8b") || ::inflateInit2(&stream, kGzipAlone) != Z_OK) return std::nullopt;
  std::string bytes;
  std::array<char, 16'384> room{};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(body.data()));
  stream.avail_in = static_cast<uInt>(body.size());
  int result = Z_OK;
  while (result == Z_OK && bytes.size() < kMostUnpacked) {
    stream.next_out = reinterpret_cast<Bytef*>(room.data());
    stream.avail_out = room.size();
    result = ::inflate(&stream, Z_NO_FLUSH);
    bytes.append(room.data(), room.size() - stream.avail_out);
  }
  ::inflateEnd(&stream);
  return result == Z_STREAM_END ? std::optional(std::move(bytes)) : std::nullopt;
}

// Lines stay, other control characters do not reach a terminal.
std::string shown(std::string_view text) {
  std::string out;
  while (!text.empty()) {
    const std::size_t end = text.find_first_of("\n\t");
    out += escapedForLog(text.substr(0, end));
    if (end == std::string_view::npos) break;
    out += text[end];
    text.remove_prefix(end + 1);
  }
  return out;
}

std::string hexadecimal(std::string_view bytes) {
  std::string out = fmt::format("{} bytes:", bytes.size());
  for (std::size_t at = 0; at < bytes.size() && at < kMostHex; at += 32)
    out += "\n" + hex(bytes.substr(at, std::min<std::size_t>(32, kMostHex - at)));
  return bytes.size() > kMostHex ? out + "\n…" : out;
}

std::uint32_t bigEndian(std::string_view bytes) {
  std::uint32_t number = 0;
  for (const char byte : bytes) number = number << 8 | static_cast<unsigned char>(byte);
  return number;
}

std::string datagram(std::string_view body) {
  const auto field = [body](std::size_t at, std::size_t size) { return bigEndian(body.substr(at, size)); };
  std::string_view device = body.substr(20, 40);
  device = device.substr(0, device.find('\0'));
  return fmt::format(
      "event number {}, client type {}, client version {}, session ID {}, category {}, type {}, device "
      "{}\n{}",
      field(60, 2), field(1, 1), ~field(12, 2) & 0xffffu, ~field(8, 4), field(16, 2), field(18, 2),
      escapedForLog(device), shown(body.substr(kDatagramHeader)));
}

}  // namespace

std::string readableBody(std::string_view kind, std::string_view body) {
  if (kind == "datagram" && body.size() >= kDatagramHeader) return datagram(body);
  const auto plain = unpacked(body);
  const std::string_view bytes = plain ? std::string_view(*plain) : body;
  if (bytes.starts_with("bplist00")) {
    const auto list = parseBinaryPropertyList(bytes, {kMostUnpacked, 128, 1'000'000, kMostUnpacked});
    if (list) return formats::writeJSON(list.value(), formats::JSONStyle::pretty);
  }
  if (const auto value = formats::parseJSON(bytes);
      value && !bytes.empty() && (bytes[0] == '{' || bytes[0] == '['))
    return formats::writeJSON(value.value(), formats::JSONStyle::pretty);
  return isUTF8(bytes) ? shown(bytes) : hexadecimal(bytes);
}

}  // namespace veltrad::ctl
