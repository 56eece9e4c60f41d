// Reads with pread: the file's own position is its owner's.
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

bool writeAll(int to, const char* bytes, std::size_t count) {
  while (count > 0) {
    const ssize_t written = ::write(to, bytes, count);
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return false;
    bytes += written;
    count -= static_cast<std::size_t>(written);
  }
  return true;
}

bool copy(int from, int to, off_t size) {
  std::string piece(kPieceBytes, '\0');
  for (off_t at = 0; at < size;) {
    const ssize_t count =
        ::pread(from, piece.data(), std::min(piece.size(), static_cast<std::size_t>(size - at)), at);
    if (count < 0 && errno == EINTR) continue;
    if (count == 0) errno = ESTALE;
    if (count <= 0 || !writeAll(to, piece.data(), static_cast<std::size_t>(count))) return false;
    at += count;
  }
  return true;
}

}  // namespace

FileDescriptor copyOfFile(int file, off_t size) {
  FileDescriptor place = placeFor(size);
  if (!place.isOpen()) return place;
  if (!copy(file, place.get(), size)) {
    const int error = errno;
    place.reset();
    errno = error;
    return place;
  }
  // Refused where it is no file of memory.
  ::fcntl(place.get(), F_ADD_SEALS, F_SEAL_SEAL | F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_WRITE);
  return place;
}

}  // namespace veltrad::client
