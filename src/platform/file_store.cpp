// SPDX-License-Identifier: Apache-2.0
// Reads and replaces files on disk.
#include "platform/file_store.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <system_error>

#include "base/file_descriptor.h"
#include "platform/shortage.h"
#include "platform/uuid.h"

namespace veltrad::platform {

namespace {

FileFailure failureOf(const std::string& path, int error) {
  using Kind = FileFailure::Kind;
  Kind kind = Kind::other;
  if (error == ENOENT || error == ENOTDIR) kind = Kind::notFound;
  if (error == EACCES || error == EPERM) kind = Kind::noAccess;
  if (error == ENOSPC || error == EDQUOT) kind = Kind::noSpace;
  if (error == EFBIG) kind = Kind::tooLarge;
  if (isShortage(error)) kind = Kind::shortage;
  if (error == ELOOP) return {kind, path + ": too many symbolic links, or one that others may have made"};
  return {kind, path + ": " + std::generic_category().message(error)};
}

FileFailure tooLarge(const std::string& path, std::size_t most) {
  return {FileFailure::Kind::tooLarge, path + ": larger than " + std::to_string(most) + " bytes"};
}

// The mode and owner of a new file; without an owner it belongs to this process.
struct Belonging {
  unsigned mode;
  std::optional<std::pair<uid_t, gid_t>> owner;
};

Result<Belonging, int> inheritedAt(const Place& place, unsigned mode) {
  struct stat status {};
  if (::fstatat(place.directory(), place.name(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
      S_ISREG(status.st_mode))
    return Belonging{status.st_mode & 0777u, {{status.st_uid, status.st_gid}}};
  if (::fstatat(place.directory(), ".", &status, 0) != 0) return Failure{errno};
  return Belonging{mode, {{status.st_uid, status.st_gid}}};
}

// A full disk or a quota may show at the sync or the close alone.
int writeNewFile(int directory, const std::string& name, std::string_view bytes, const Belonging& belonging) {
  constexpr int kFlags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
  FileDescriptor file(::openat(directory, name.c_str(), kFlags, 0600));
  if (!file.isOpen()) return errno;
  int error = writeAll(file.get(), bytes);
  if (error == 0 && belonging.owner &&
      ::fchown(file.get(), belonging.owner->first, belonging.owner->second) != 0)
    error = errno;
  // Exactly this mode, whatever the umask.
  if (error == 0 && ::fchmod(file.get(), belonging.mode) != 0) error = errno;
  if (error == 0 && ::fsync(file.get()) != 0) error = errno;
  if (::close(file.release()) != 0 && error == 0) error = errno;
  if (error != 0) ::unlinkat(directory, name.c_str(), 0);
  return error;
}

int syncDirectoryOf(const Place& place) {
  const std::string path = directoryOf(place.name());
  const FileDescriptor directory(
      ::openat(place.directory(), path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directory.isOpen()) return errno;
  if (::fsync(directory.get()) == 0) return 0;
  return errno == EINVAL ? 0 : errno;  // EINVAL: the file system does not support it
}

std::uint64_t mixed(std::uint64_t hash, std::uint64_t number) {
  for (int i = 0; i < 8; ++i) {
    hash = (hash ^ (number & 0xff)) * 0x100000001b3u;  // FNV-1a
    number >>= 8;
  }
  return hash;
}

// NAME.XXXXXXXX.new, as replace() makes it.
bool isUnfinishedName(std::string_view name) {
  constexpr std::size_t kDigits = 8;
  constexpr std::string_view kEnd = ".new";
  constexpr std::size_t kTail = 1 + kDigits + kEnd.size();
  if (name.size() <= kTail || !name.ends_with(kEnd)) return false;
  const std::string_view tail = name.substr(name.size() - kTail, 1 + kDigits);
  return tail[0] == '.' && tail.find_first_not_of("0123456789abcdefABCDEF", 1) == std::string_view::npos;
}

}  // namespace

Result<std::string, FileFailure> DiskFileStore::read(const std::string& path, std::size_t most) {
  // O_NONBLOCK: a pipe of this name must not block the caller.
  const auto place = Place::of(path, _ownership);
  if (!place) return Failure{failureOf(path, place.error())};
  const int flags = O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY | place.value().links();
  const FileDescriptor file(::openat(place.value().directory(), place.value().name(), flags));
  if (!file.isOpen()) return Failure{failureOf(path, errno)};
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return Failure{failureOf(path, errno)};
  if (!S_ISREG(status.st_mode)) {
    return Failure{FileFailure{FileFailure::Kind::other, path + ": not a regular file"}};
  }
  if (static_cast<std::uint64_t>(status.st_size) > most) return Failure{tooLarge(path, most)};

  // The size is only a hint: it is 0 under /proc, and a file may grow.
  std::string bytes;
  std::size_t length = 0;
  std::size_t room = static_cast<std::size_t>(status.st_size) + 1;
  while (true) {
    bytes.resize(length + room);
    const ssize_t got = ::read(file.get(), bytes.data() + length, room);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return Failure{failureOf(path, errno)};
    length += static_cast<std::size_t>(got);
    if (length > most) return Failure{tooLarge(path, most)};
    if (got == 0) break;
    room = std::max<std::size_t>(bytes.size() - length, 4'096);
  }
  bytes.resize(length);
  return bytes;
}

Result<Done, FileFailure> DiskFileStore::replace(const std::string& path, std::string_view bytes,
                                                 unsigned mode) {
  const auto place = Place::of(path, _ownership);
  if (!place) return Failure{failureOf(path, place.error())};
  const int directory = place.value().directory();
  const char* name = place.value().name();
  const std::string fresh = name + ("." + randomUUIDText().substr(0, 8)) + ".new";
  auto belonging = _ownership == Ownership::own ? Belonging{mode, {}} : inheritedAt(place.value(), mode);
  if (!belonging) return Failure{failureOf(path, belonging.error())};
  if (const int error = writeNewFile(directory, fresh, bytes, belonging.value()))
    return Failure{failureOf(path, error)};
  if (::renameat(directory, fresh.c_str(), directory, name) != 0) {
    const int error = errno;
    ::unlinkat(directory, fresh.c_str(), 0);
    return Failure{failureOf(path, error)};
  }
  if (const int error = syncDirectoryOf(place.value())) return Failure{failureOf(directoryOf(path), error)};
  return Done();
}

Result<Done, FileFailure> DiskFileStore::rename(const std::string& from, const std::string& to) {
  const auto place = Place::of(from, _ownership);
  if (!place) return Failure{failureOf(from, place.error())};
  const auto target = Place::of(to, _ownership);
  if (!target) return Failure{failureOf(to, target.error())};
  if (::renameat(place.value().directory(), place.value().name(), target.value().directory(),
                 target.value().name()) != 0)
    return Failure{failureOf(from, errno)};
  if (const int error = syncDirectoryOf(target.value())) return Failure{failureOf(directoryOf(to), error)};
  return Done();
}

Result<Done, FileFailure> DiskFileStore::unlink(const std::string& path) {
  const auto place = Place::of(path, _ownership);
  const int error = !place                                                                ? place.error()
                    : ::unlinkat(place.value().directory(), place.value().name(), 0) != 0 ? errno
                                                                                          : 0;
  if (error != 0 && error != ENOENT) return Failure{failureOf(path, error)};
  return Done();
}

Result<FileStamp, FileFailure> DiskFileStore::stamp(const std::string& path) {
  const auto place = Place::of(path, _ownership);
  struct stat status {};
  const int flags = _ownership == Ownership::own ? 0 : AT_SYMLINK_NOFOLLOW;
  const int error = !place ? place.error()
                    : ::fstatat(place.value().directory(), place.value().name(), &status, flags) != 0 ? errno
                                                                                                      : 0;
  if (isShortage(error)) return Failure{failureOf(path, error)};
  if (error != 0) return FileStamp();
  std::uint64_t hash = 0xcbf29ce484222325u;
  for (const auto part :
       {static_cast<std::uint64_t>(status.st_dev), static_cast<std::uint64_t>(status.st_ino),
        static_cast<std::uint64_t>(status.st_size), static_cast<std::uint64_t>(status.st_mtim.tv_sec),
        static_cast<std::uint64_t>(status.st_mtim.tv_nsec), static_cast<std::uint64_t>(status.st_ctim.tv_sec),
        static_cast<std::uint64_t>(status.st_ctim.tv_nsec)}) {
    hash = mixed(hash, part);
  }
  return FileStamp(hash);
}

Result<Done, FileFailure> makeDirectories(const std::string& path, unsigned mode, Ownership ownership) {
  if (ownership == Ownership::inherited) {
    const auto made = openDirectory(path, mode);
    return made ? Result<Done, FileFailure>(Done()) : Failure{failureOf(path, made.error())};
  }
  for (std::size_t end = path.find('/', 1);; end = path.find('/', end + 1)) {
    const std::string part = path.substr(0, end);
    if (::mkdir(part.c_str(), mode) != 0 && errno != EEXIST) {
      const int error = errno;
      // An existing parent on a read-only or inaccessible file system is no error.
      struct stat status {};
      if (::stat(part.c_str(), &status) != 0) return Failure{failureOf(part, error)};
    }
    if (end == std::string::npos) break;
  }
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) return Failure{failureOf(path, errno)};
  if (!S_ISDIR(status.st_mode)) return Failure{failureOf(path, ENOTDIR)};
  return Done();
}

Result<Done, FileFailure> tryWritingIn(const std::string& directory) {
  if (auto made = makeDirectories(directory); !made) return made;
  const std::string path = directory + "/tried." + randomUUIDText().substr(0, 8) + ".new";
  if (const int error = writeNewFile(AT_FDCWD, path, ".", {})) return Failure{failureOf(directory, error)};
  ::unlink(path.c_str());
  return Done();
}

std::size_t removeUnfinishedFiles(const std::string& directory) {
  std::size_t removed = 0;
  std::error_code failure;
  for (std::filesystem::directory_iterator at(directory, failure), end; !failure && at != end;
       at.increment(failure)) {
    struct stat status {};
    const std::string path = at->path().string();
    if (!isUnfinishedName(at->path().filename().string()) || ::lstat(path.c_str(), &status) != 0) continue;
    if (S_ISREG(status.st_mode) && ::unlink(path.c_str()) == 0) ++removed;
  }
  return removed;
}

}  // namespace veltrad::platform
