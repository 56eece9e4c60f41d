// SPDX-License-Identifier: Apache-2.0
// Opens and removes a file relative to its directory.
#include "client/uploaded_file.h"

#include <fcntl.h>
#include <sys/random.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <system_error>

#include "base/filled_text.h"
#include "base/text.h"
#include "client/lent_copy.h"
#include "wire/file_origin.h"

namespace veltrad::client {

namespace {

constexpr off_t kMostBytes = 0x7fffffff;  // the daemon's limit

std::string absolute(const std::string& path) {
  if (!path.empty() && path.front() == '/') return path;
  char* current = ::getcwd(nullptr, 0);
  std::string whole = current ? std::string(current) + '/' + path : path;
  ::free(current);
  return whole;
}

const char* kindOfFile(mode_t mode) {
  if (S_ISLNK(mode)) return "a symbolic link";
  if (S_ISDIR(mode)) return "a directory";
  if (S_ISFIFO(mode)) return "a FIFO";
  if (S_ISSOCK(mode)) return "a socket";
  return "a device";
}

// A name that cannot be guessed; it contains the file's name for people who find it. Empty if there are no
// random bytes.
std::string nameAside(const std::string& name) {
  constexpr std::size_t kMostOfName = 200;  // keeps the result below 255 bytes
  std::uint64_t random[2];
  if (::getrandom(random, sizeof random, GRND_NONBLOCK) != sizeof random) return {};
  return filled(".{}.{}", name.substr(0, kMostOfName),
                hex({reinterpret_cast<const char*>(random), sizeof random}));
}

// 0, or an errno. Replaces nothing: if the file system lacks RENAME_NOREPLACE (NFS, some FUSE), it uses a
// link, or a plain rename to a name that nobody else uses.
int moveTo(int directory, const std::string& from, const std::string& to, bool nobodyUsesTo) {
  if (::renameat2(directory, from.c_str(), directory, to.c_str(), RENAME_NOREPLACE) == 0) return 0;
  if (errno != EINVAL && errno != ENOSYS) return errno;
  if (nobodyUsesTo) return ::renameat(directory, from.c_str(), directory, to.c_str()) == 0 ? 0 : errno;
  if (::linkat(directory, from.c_str(), directory, to.c_str(), 0) != 0) return errno;
  return ::unlinkat(directory, from.c_str(), 0) == 0 ? 0 : errno;
}

}  // namespace

UploadedFile::UploadedFile(const std::string& path) : _absolutePath(absolute(path)) {
  const std::size_t slash = path.rfind('/');
  _name = slash == std::string::npos ? path : path.substr(slash + 1);
  const std::string directory = slash == std::string::npos ? "." : path.substr(0, slash + 1);
  _directory.reset(::open(directory.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (_directory.isOpen()) {
    open();
  } else {
    _problem = failed("cannot be opened", errno);
  }
}

void UploadedFile::open() {
  if (::fstatat(_directory.get(), _name.c_str(), &_facts, AT_SYMLINK_NOFOLLOW) != 0) {
    _problem = failed("cannot be opened", errno);
    return;
  }
  // Only regular files are opened: opening a FIFO or a device may have effects.
  if (S_ISREG(_facts.st_mode)) {
    _file.reset(
        ::openat(_directory.get(), _name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (!_file.isOpen() || ::fstat(_file.get(), &_facts) != 0) {
      _problem = failed("cannot be opened", errno);
      _file.reset();
      return;
    }
  }
  const std::string shown = escapedForLog(_absolutePath);
  if (!S_ISREG(_facts.st_mode)) {
    _problem = filled("{} is {}: expected a regular file.", shown, kindOfFile(_facts.st_mode));
  } else if (_facts.st_size == 0) {
    _problem = filled("{} is empty.", shown);
  } else if (_facts.st_size > kMostBytes) {
    _problem = filled("{} has {} bytes: at most {} are uploaded.", shown, _facts.st_size, kMostBytes);
  } else {
    copyIfServedByOthers();
  }
}

void UploadedFile::copyIfServedByOthers() {
  using Kind = wire::FileOrigin::Kind;
  const auto origin = wire::FileOrigin::of(_file.get(), 0);
  if (origin.kind == Kind::local) return;
  // The daemon takes a stacked file if it sees the same mounts, so only a copy in memory is worthwhile.
  if (origin.kind == Kind::stacked && _facts.st_size > kMostCopiedInMemory) return;
  _copy = copyOfFile(_file.get(), _facts.st_size);
  if (_copy.isOpen() || origin.kind == Kind::stacked) return;
  _problem =
      failed(filled("lies on a file system of type {} and cannot be copied", origin.fileSystem), errno);
}

// Checking a path and then removing it would be a race. So the file is first renamed to a name that nobody
// else uses, and is checked under that name.
std::optional<std::string> UploadedFile::remove() const {
  struct stat now {};
  if (::fstatat(_directory.get(), _name.c_str(), &now, AT_SYMLINK_NOFOLLOW) != 0) {
    return failed("is stored, but cannot be found any more", errno);
  }
  const std::string other = filled("{} is stored, but another file has taken its place, which stays.",
                                   escapedForLog(_absolutePath));
  if (!isSame(now)) return other;
  if (_copy.isOpen() && (now.st_size != _facts.st_size || now.st_mtim.tv_sec != _facts.st_mtim.tv_sec ||
                         now.st_mtim.tv_nsec != _facts.st_mtim.tv_nsec)) {
    return filled("{} is stored, but has changed since, so it stays.", escapedForLog(_absolutePath));
  }
  const std::string aside = nameAside(_name);
  const int error = aside.empty() ? EAGAIN : moveTo(_directory.get(), _name, aside, true);
  if (error == ENOENT) return failed("is stored, but cannot be found any more", error);
  if (error != 0) return failed("is stored, but cannot be removed", error);
  if (::fstatat(_directory.get(), aside.c_str(), &now, AT_SYMLINK_NOFOLLOW) != 0) {
    return failed("is stored, but cannot be found any more", errno);
  }
  if (!isSame(now)) {
    const std::string problem = putBack(aside);
    return problem.empty() ? other : problem;
  }
  if (::unlinkat(_directory.get(), aside.c_str(), 0) != 0) {
    const int why = errno;
    const std::string problem = putBack(aside);
    return problem.empty() ? failed("is stored, but cannot be removed", why) : problem;
  }
  return std::nullopt;
}

bool UploadedFile::isSame(const struct stat& other) const {
  return S_ISREG(other.st_mode) && other.st_dev == _facts.st_dev && other.st_ino == _facts.st_ino;
}

// Empty if the file has its name again.
std::string UploadedFile::putBack(const std::string& aside) const {
  const int error = moveTo(_directory.get(), aside, _name, false);
  if (error == 0) return {};
  return filled("{} is stored; another file that had taken its place is now {} beside it: {}.",
                escapedForLog(_absolutePath), escapedForLog(aside),
                std::error_code(error, std::generic_category()).message());
}

std::string UploadedFile::failed(const std::string& what, int error) const {
  return filled("{} {}: {}.", escapedForLog(_absolutePath), what,
                std::error_code(error, std::generic_category()).message());
}

}  // namespace veltrad::client
