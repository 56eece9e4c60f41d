// SPDX-License-Identifier: Apache-2.0
// Uses flock() on a file that is never removed.
#include "platform/daemon_lock.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string_view>
#include <system_error>
#include <utility>

namespace veltrad::platform {

namespace {

std::string holderOf(int lock) {
  char text[32] = {};
  const ssize_t count = ::pread(lock, text, sizeof text - 1, 0);
  std::string_view number(text, count > 0 ? static_cast<std::size_t>(count) : 0);
  number = number.substr(0, number.find_first_not_of("0123456789"));
  return number.empty() ? "another process" : fmt::format("process {}", number);
}

Failure<LockRefusal> outOfReach(const std::string& path, int error) {
  return {{false, fmt::format("{}: {}", path, std::generic_category().message(error))}};
}

Result<FileDescriptor, int> openLock(const std::string& path, Ownership ownership) {
  const auto place = Place::of(path, ownership);
  if (!place) return Failure{place.error()};
  const int directory = place.value().directory();
  const char* name = place.value().name();
  constexpr int kFlags = O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK;
  FileDescriptor lock(::openat(directory, name, kFlags | O_EXCL, 0644));
  if (lock.isOpen() && ownership == Ownership::inherited) {
    const int error = place.value().giveToOwner(lock.get());
    if (error != 0) return Failure{error};
  }
  if (!lock.isOpen() && errno == EEXIST) lock.reset(::openat(directory, name, kFlags, 0644));
  struct stat status {};
  if (!lock.isOpen() || ::fstat(lock.get(), &status) != 0) return Failure{errno};
  // The holder's number is written into it: not into a file that has another name, too.
  if (!S_ISREG(status.st_mode) || status.st_nlink > 1) return Failure{EMLINK};
  return lock;
}

}  // namespace

Result<FileDescriptor, LockRefusal> takeDaemonLock(const std::string& path, Ownership ownership) {
  auto opened = openLock(path, ownership);
  if (!opened) return outOfReach(path, opened.error());
  FileDescriptor lock = std::move(opened.value());
  if (::flock(lock.get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno != EWOULDBLOCK) return outOfReach(path, errno);
    return Failure{LockRefusal{true, fmt::format("{} holds {}", holderOf(lock.get()), path)}};
  }
  // The content is only information; the lock works without it.
  const std::string holder = fmt::format("{}\n", ::getpid());
  if (::ftruncate(lock.get(), 0) == 0) {
    [[maybe_unused]] const ssize_t written = ::pwrite(lock.get(), holder.data(), holder.size(), 0);
  }
  return lock;
}

}  // namespace veltrad::platform
