// SPDX-License-Identifier: Apache-2.0
// Walks a path directory by directory, so that each is judged before a link in it is followed.
#include "platform/place.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>

namespace veltrad::platform {

namespace {

// Whether somebody else can have made a link there.
bool isOpenToOthers(const struct stat& directory) {
  const bool foreign = directory.st_uid != 0 && directory.st_uid != ::geteuid();
  return foreign || (directory.st_mode & (S_IWGRP | S_IWOTH)) != 0;
}

bool isLink(int directory, const std::string& name) {
  struct stat status {};
  return ::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISLNK(status.st_mode);
}

// Nothing where it is so already, which needs no right.
int give(int file, uid_t user, gid_t group) {
  struct stat status {};
  if (::fstat(file, &status) != 0) return errno;
  if (status.st_uid == user && status.st_gid == group) return 0;
  return ::fchownat(file, "", user, group, AT_EMPTY_PATH) == 0 ? 0 : errno;
}

Result<FileDescriptor, int> step(const FileDescriptor& from, const std::string& name,
                                 std::optional<unsigned> mode) {
  struct stat status {};
  if (::fstat(from.get(), &status) != 0) return Failure{errno};
  // If it fails, the opening says why.
  const bool made = mode && ::mkdirat(from.get(), name.c_str(), *mode) == 0;
  const int links = made || isOpenToOthers(status) ? O_NOFOLLOW : 0;
  FileDescriptor next(::openat(from.get(), name.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC | links));
  if (!next.isOpen()) return Failure{errno == ENOTDIR && isLink(from.get(), name) ? ELOOP : errno};
  const int error = made ? give(next.get(), status.st_uid, status.st_gid) : 0;
  if (error != 0) return Failure{error};
  return next;
}

}  // namespace

std::string directoryOf(const std::string& path) {
  const auto slash = path.rfind('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

Result<FileDescriptor, int> openDirectory(const std::string& path, std::optional<unsigned> mode) {
  FileDescriptor at(::open(path.starts_with('/') ? "/" : ".", O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!at.isOpen()) return Failure{errno};
  for (std::size_t begin = 0; begin < path.size();) {
    const std::size_t end = std::min(path.find('/', begin), path.size());
    const std::string name = path.substr(begin, end - begin);
    begin = end + 1;
    if (name.empty()) continue;
    auto next = step(at, name, mode);
    if (!next) return next;
    at = std::move(next.value());
  }
  return at;
}

Result<Place, int> Place::of(const std::string& path, Ownership ownership) {
  if (ownership == Ownership::own) return Place(FileDescriptor(), path);
  auto directory = openDirectory(directoryOf(path));
  if (!directory) return Failure{directory.error()};
  return Place(std::move(directory.value()), path.substr(path.rfind('/') + 1));
}

int Place::directory() const {
  return _directory.isOpen() ? _directory.get() : AT_FDCWD;
}

int Place::links() const {
  return _directory.isOpen() ? O_NOFOLLOW : 0;
}

int Place::giveToOwner(int file) const {
  struct stat status {};
  return ::fstat(_directory.get(), &status) == 0 ? give(file, status.st_uid, status.st_gid) : errno;
}

}  // namespace veltrad::platform
