// SPDX-License-Identifier: Apache-2.0
// One flock on a file that stays.
#include "platform/daemon_lock.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <string_view>
#include <system_error>

namespace veltrad::platform {

namespace {

std::string holderOf(int lock) {
  char text[32] = {};
  const ssize_t count = ::pread(lock, text, sizeof text - 1, 0);
  std::string_view number(text, count > 0 ? static_cast<std::size_t>(count) : 0);
  number = number.substr(0, number.find_first_not_of("0123456789"));
  return number.empty() ? "another process" : fmt::format("process {}", number);
}

Failure<LockRefusal> outOfReach(const std::string& path) {
  return {{false, fmt::format("{}: {}", path, std::generic_category().message(errno))}};
}

}  // namespace

Result<FileDescriptor, LockRefusal> takeDaemonLock(const std::string& path) {
  FileDescriptor lock(::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644));
  if (!lock.isOpen()) return outOfReach(path);
  if (::flock(lock.get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno != EWOULDBLOCK) return outOfReach(path);
    return Failure{LockRefusal{true, fmt::format("{} holds {}", holderOf(lock.get()), path)}};
  }
  // Who holds it is for people; the lock holds without it.
  const std::string holder = fmt::format("{}\n", ::getpid());
  if (::ftruncate(lock.get(), 0) == 0) {
    [[maybe_unused]] const ssize_t written = ::pwrite(lock.get(), holder.data(), holder.size(), 0);
  }
  return lock;
}

}  // namespace veltrad::platform
