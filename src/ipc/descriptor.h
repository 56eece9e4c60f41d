// A file descriptor that is closed when its owner goes. A plain value; any thread, one at a time.
#pragma once

#include <unistd.h>

#include <utility>

namespace veltrad::ipc {

class Descriptor {
 public:
  Descriptor() = default;
  explicit Descriptor(int number) : _number(number) {}
  Descriptor(Descriptor&& other) noexcept : _number(std::exchange(other._number, -1)) {}
  Descriptor& operator=(Descriptor&& other) noexcept {
    if (this != &other) {
      close();
      _number = std::exchange(other._number, -1);
    }
    return *this;
  }
  ~Descriptor() { close(); }

  int get() const { return _number; }
  explicit operator bool() const { return _number >= 0; }
  void close() {
    if (_number >= 0) ::close(std::exchange(_number, -1));
  }

 private:
  int _number = -1;
};

}  // namespace veltrad::ipc
