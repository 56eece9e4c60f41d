// A file as it is when its upload begins, read through a descriptor. One thread at a time.
#pragma once

#include <sys/stat.h>

#include <cstddef>
#include <optional>

namespace veltrad::backends {

// The daemon reads nothing but the bytes that were there at the beginning, whatever becomes of the file: one
// that grows has no end, and one that others shorten must not be mapped.
class FileSnapshot {
 public:
  // zlib and the system's calls count so far.
  static constexpr off_t kMostBytes = 0x7fffffff;  // 2 GiB - 1

  // Nothing: `descriptor` is none, or not that of a regular file. It stays the caller's and outlives this.
  static std::optional<FileSnapshot> of(int descriptor);

  off_t size() const { return _size; }
  enum class Content { some, none, unreadable };
  // By its first byte; where it is unreadable errno says why.
  Content content() const;
  // At most `room` bytes from where the last call ended; 0 at the end, which a file that was shortened has
  // early. Nothing: it cannot be read, and errno says why.
  std::optional<std::size_t> read(char* place, std::size_t room);
  // The file is no longer what it was at the beginning, or has ended before the size that it has.
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
