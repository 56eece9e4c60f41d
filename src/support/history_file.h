// SPDX-License-Identifier: Apache-2.0
// The form of a day's file of the history, and its reader. One thread each.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "base/value.h"

namespace veltrad::support {

// A record is the length of its header (4 bytes), that of its body (8 bytes), the header as JSON, the body as
// it left, and the CRC-32 of all of these (4 bytes). Numbers are big-endian.
struct HistoryPlace {
  std::uint64_t offset = 0;
  std::uint32_t headerBytes = 0;
  std::uint64_t bodyBytes = 0;

  std::uint64_t body() const { return offset + kLengths + headerBytes; }
  std::uint64_t end() const { return body() + bodyBytes + kChecksum; }

  static constexpr std::size_t kLengths = 12;
  static constexpr std::size_t kChecksum = 4;
  static constexpr std::size_t kMostHeader = 1u << 20;
};

std::string historyLengths(std::size_t headerBytes, std::uint64_t bodyBytes);
std::string historyChecksum(std::uint32_t crc);
std::uint32_t historyCRC(std::uint32_t crc, std::string_view bytes);

class HistoryFile {
 public:
  // One that cannot be opened has no records.
  explicit HistoryFile(const std::string& path);
  explicit HistoryFile(FileDescriptor file);

  std::uint64_t size() const { return _size; }
  int descriptor() const { return _file.get(); }
  // The record there; nothing: at or beyond the last one that is complete.
  std::optional<HistoryPlace> at(std::uint64_t offset) const;
  // Nothing if it is damaged.
  std::optional<Dictionary> header(const HistoryPlace& place) const;
  bool isIntact(const HistoryPlace& place) const;
  // At most `most` bytes of the body, from its byte `from` on.
  std::string body(const HistoryPlace& place, std::uint64_t from, std::size_t most) const;
  // Where the last intact record ends.
  std::uint64_t intactEnd() const;

 private:
  std::string read(std::uint64_t offset, std::uint64_t bytes) const;

  FileDescriptor _file;
  std::uint64_t _size = 0;
};

}  // namespace veltrad::support
