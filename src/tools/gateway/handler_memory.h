// SPDX-License-Identifier: Apache-2.0
// Lets any thread give the server's thread something to do without finding memory for it.
#pragma once

#include <cstddef>
#include <new>

namespace veltrad::gateway {

// Room for one handler that waits for the server's thread. A second one would get other memory.
class HandlerMemory {
 public:
  HandlerMemory() = default;
  HandlerMemory(const HandlerMemory&) = delete;

  void* take(std::size_t bytes) {
    if (_taken || bytes > sizeof _room) return ::operator new(bytes);
    _taken = true;
    return _room;
  }
  void give(void* room) {
    if (room != _room) return ::operator delete(room);
    _taken = false;
  }

 private:
  alignas(std::max_align_t) std::byte _room[128];
  bool _taken = false;
};

// As Asio uses it. The memory must outlive the handler.
template <typename T>
class HandlerAllocator {
 public:
  using value_type = T;

  explicit HandlerAllocator(HandlerMemory& memory) : _memory(&memory) {}
  template <typename Other>
  HandlerAllocator(const HandlerAllocator<Other>& other) : _memory(other.memory()) {}

  HandlerMemory* memory() const { return _memory; }
  T* allocate(std::size_t count) { return static_cast<T*>(_memory->take(count * sizeof(T))); }
  void deallocate(T* room, std::size_t) { _memory->give(room); }
  bool operator==(const HandlerAllocator& other) const { return _memory == other._memory; }

 private:
  HandlerMemory* _memory;
};

}  // namespace veltrad::gateway
