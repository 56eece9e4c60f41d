// SPDX-License-Identifier: Apache-2.0
// Reads a lent file through its descriptor, up to the size at the beginning of the upload.
#pragma once

#include <sys/stat.h>

#include <cstddef>
#include <optional>

namespace veltrad::backends {

// Reads only the bytes that were there at the beginning, because a file may grow without end. Does not map
// the file, because others may shorten it.
class FileSnapshot {
 public:
  // 2 GiB - 1, the limit of zlib and of system calls.
  static constexpr off_t kMostBytes = 0x7fffffff;

  // Nothing if it is not a regular file. The descriptor stays the caller's and must outlive this object.
  static std::optional<FileSnapshot> of(int descriptor);

  off_t size() const { return _size; }
  enum class Content { some, none, unreadable };
  // Tries to read the first byte. If it is unreadable, errno says why.
  Content content() const;
  // Reads at most `room` bytes from where the last call ended. Returns 0 at the end, which comes early if the
  // file was shortened; nothing if it cannot be read, and errno says why.
  std::optional<std::size_t> read(char* place, std::size_t room);
  // Whether the file has changed since the beginning, or ended early.
  bool changed() const;

 private:
  FileSnapshot(int descriptor, const struct stat& facts)
      : _descriptor(descriptor), _size(facts.st_size), _modified(facts.st_mtim) {}

  std::optional<std::size_t> readAt(off_t at, char* place, std::size_t room) const;

  int _descriptor;
  off_t _size;
  timespec _modified;
  off_t _at = 0;
  bool _endedEarly = false;
};

}  // namespace veltrad::backends
