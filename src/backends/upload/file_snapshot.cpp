// SPDX-License-Identifier: Apache-2.0
// Uses fstat and pread only, which do not depend on a path.
#include "backends/upload/file_snapshot.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>

namespace veltrad::backends {

std::optional<FileSnapshot> FileSnapshot::of(int descriptor) {
  struct stat facts {};
  if (descriptor < 0 || ::fstat(descriptor, &facts) != 0 || !S_ISREG(facts.st_mode)) return std::nullopt;
  return FileSnapshot(descriptor, facts);
}

FileSnapshot::Content FileSnapshot::content() const {
  char first;
  const auto count = readAt(0, &first, 1);
  if (!count) return Content::unreadable;
  return *count > 0 ? Content::some : Content::none;
}

std::optional<std::size_t> FileSnapshot::read(char* place, std::size_t room) {
  const auto count = readAt(_at, place, room);
  if (!count) return std::nullopt;
  if (*count == 0 && _at < _size) _endedEarly = true;
  _at += static_cast<off_t>(*count);
  return count;
}

std::optional<std::size_t> FileSnapshot::readAt(off_t at, char* place, std::size_t room) const {
  room = std::min(room, static_cast<std::size_t>(_size - at));
  // Some files of the kernel have no size, and reading them would block.
  if (room == 0) return 0;
  ssize_t count;
  do {
    count = ::pread(_descriptor, place, room, at);
  } while (count < 0 && errno == EINTR);
  return count < 0 ? std::nullopt : std::optional(static_cast<std::size_t>(count));
}

bool FileSnapshot::changed() const {
  struct stat facts {};
  return _endedEarly || ::fstat(_descriptor, &facts) != 0 || facts.st_size != _size ||
         facts.st_mtim.tv_sec != _modified.tv_sec || facts.st_mtim.tv_nsec != _modified.tv_nsec;
}

}  // namespace veltrad::backends
