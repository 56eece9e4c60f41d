// SPDX-License-Identifier: Apache-2.0
// Reads a day's file of the history.
#include "support/history_file.h"

#include <endian.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <zlib.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

#include "formats/json.h"

namespace veltrad::support {

std::string historyLengths(std::size_t headerBytes, std::uint64_t bodyBytes) {
  const std::uint32_t header = htobe32(static_cast<std::uint32_t>(headerBytes));
  const std::uint64_t body = htobe64(bodyBytes);
  std::string bytes(reinterpret_cast<const char*>(&header), sizeof header);
  return bytes.append(reinterpret_cast<const char*>(&body), sizeof body);
}

std::string historyChecksum(std::uint32_t crc) {
  const std::uint32_t bytes = htobe32(crc);
  return {reinterpret_cast<const char*>(&bytes), sizeof bytes};
}

std::uint32_t historyCRC(std::uint32_t crc, std::string_view bytes) {
  return static_cast<std::uint32_t>(
      crc32_z(crc, reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size()));
}

HistoryFile::HistoryFile(const std::string& path)
    : HistoryFile(FileDescriptor(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC))) {}

HistoryFile::HistoryFile(FileDescriptor file) : _file(std::move(file)) {
  struct stat status {};
  if (_file.isOpen() && ::fstat(_file.get(), &status) == 0 && S_ISREG(status.st_mode))
    _size = static_cast<std::uint64_t>(status.st_size);
}

std::string HistoryFile::read(std::uint64_t offset, std::uint64_t bytes) const {
  std::string text(bytes, '\0');
  std::size_t got = 0;
  while (got < text.size()) {
    const ssize_t count =
        ::pread(_file.get(), text.data() + got, text.size() - got, static_cast<off_t>(offset + got));
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) break;
    got += static_cast<std::size_t>(count);
  }
  text.resize(got);
  return text;
}

std::optional<HistoryPlace> HistoryFile::at(std::uint64_t offset) const {
  if (offset > _size || _size - offset < HistoryPlace::kLengths) return std::nullopt;
  const std::string lengths = read(offset, HistoryPlace::kLengths);
  if (lengths.size() != HistoryPlace::kLengths) return std::nullopt;
  std::uint32_t header = 0;
  std::uint64_t body = 0;
  std::memcpy(&header, lengths.data(), sizeof header);
  std::memcpy(&body, lengths.data() + sizeof header, sizeof body);
  const HistoryPlace place{offset, be32toh(header), be64toh(body)};
  if (place.headerBytes == 0 || place.headerBytes > HistoryPlace::kMostHeader || place.bodyBytes > _size ||
      place.end() > _size)
    return std::nullopt;
  return place;
}

std::optional<Dictionary> HistoryFile::header(const HistoryPlace& place) const {
  auto parsed = formats::parseJSON(read(place.offset + HistoryPlace::kLengths, place.headerBytes));
  const Dictionary* header = parsed ? parsed.value().asDictionary() : nullptr;
  return header ? std::optional(*header) : std::nullopt;
}

std::string HistoryFile::body(const HistoryPlace& place, std::uint64_t from, std::size_t most) const {
  if (from >= place.bodyBytes) return {};
  return read(place.body() + from, std::min<std::uint64_t>(most, place.bodyBytes - from));
}

bool HistoryFile::isIntact(const HistoryPlace& place) const {
  constexpr std::uint64_t kPiece = 256u << 10;
  const std::uint64_t end = place.end() - HistoryPlace::kChecksum;
  std::uint32_t crc = 0;
  for (std::uint64_t offset = place.offset; offset < end;) {
    const std::string piece = read(offset, std::min(kPiece, end - offset));
    if (piece.empty()) return false;
    crc = historyCRC(crc, piece);
    offset += piece.size();
  }
  return read(end, HistoryPlace::kChecksum) == historyChecksum(crc);
}

std::uint64_t HistoryFile::intactEnd() const {
  std::uint64_t end = 0;
  for (auto place = at(0); place; place = at(place->end())) {
    if (isIntact(*place)) end = place->end();
  }
  return end;
}

}  // namespace veltrad::support
