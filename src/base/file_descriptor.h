// SPDX-License-Identifier: Apache-2.0
// A file descriptor that is closed with its owner, and writing to one.
#pragma once

#include <unistd.h>

#include <cerrno>
#include <string_view>
#include <utility>

namespace veltrad {

class FileDescriptor {
 public:
  FileDescriptor() = default;
  explicit FileDescriptor(int descriptor) : _descriptor(descriptor) {}
  FileDescriptor(FileDescriptor&& other) noexcept : _descriptor(other.release()) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    if (this != &other) reset(other.release());
    return *this;
  }
  ~FileDescriptor() { reset(); }

  bool isOpen() const { return _descriptor >= 0; }
  int get() const { return _descriptor; }
  int release() { return std::exchange(_descriptor, -1); }
  void reset(int descriptor = -1) {
    if (_descriptor >= 0) ::close(_descriptor);
    _descriptor = descriptor;
  }

 private:
  int _descriptor = -1;
};

// Writes all of `bytes`. Returns 0, or the errno of the call that failed.
inline int writeAll(int descriptor, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written = ::write(descriptor, bytes.data(), bytes.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return errno;
    bytes.remove_prefix(static_cast<std::size_t>(written));
  }
  return 0;
}

}  // namespace veltrad
