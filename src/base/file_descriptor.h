// A file descriptor that is closed with its owner. A plain value; any thread.
#pragma once

#include <unistd.h>

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

}  // namespace veltrad
