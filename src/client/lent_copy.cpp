// SPDX-License-Identifier: Apache-2.0
// Copies with pread, which leaves the file's position unchanged.
#include "client/lent_copy.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <string>

namespace veltrad::client {

namespace {

constexpr std::size_t kPieceBytes = 64u << 10;

FileDescriptor inDirectory(const std::string& directory) {
  FileDescriptor file(::open(directory.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600));
  if (file.isOpen() || (errno != EOPNOTSUPP && errno != EISDIR && errno != EINVAL)) return file;
  std::string name = directory + "/veltra-XXXXXX";
  file.reset(::mkostemp(name.data(), O_CLOEXEC));
  if (file.isOpen()) ::unlink(name.c_str());
  return file;
}

FileDescriptor placeFor(off_t size) {
  if (size <= kMostCopiedInMemory)
    return FileDescriptor(::memfd_create("veltra-upload", MFD_CLOEXEC | MFD_ALLOW_SEALING));
  const char* chosen = ::secure_getenv("TMPDIR");
  return inDirectory(chosen && *chosen ? chosen : "/tmp");
}

// 0, or an errno.
int copy(int from, int to, off_t size) {
  std::string piece(kPieceBytes, '\0');
  for (off_t at = 0; at < size;) {
    const ssize_t count =
        ::pread(from, piece.data(), std::min(piece.size(), static_cast<std::size_t>(size - at)), at);
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return count == 0 ? ESTALE : errno;
    if (const int error = writeAll(to, {piece.data(), static_cast<std::size_t>(count)})) return error;
    at += count;
  }
  return 0;
}

}  // namespace

FileDescriptor copyOfFile(int file, off_t size) {
  FileDescriptor place = placeFor(size);
  if (!place.isOpen()) return place;
  if (const int error = copy(file, place.get(), size)) {
    place.reset();
    errno = error;
    return place;
  }
  // Fails, without harm, if it is not a memory file.
  ::fcntl(place.get(), F_ADD_SEALS, F_SEAL_SEAL | F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_WRITE);
  return place;
}

}  // namespace veltrad::client
