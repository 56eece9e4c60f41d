// SPDX-License-Identifier: Apache-2.0
// An allocator for RapidJSON that throws, because RapidJSON does not check for null.
#pragma once

#include <cstddef>
#include <cstdlib>
#include <new>

namespace veltrad::formats {

// Throws std::bad_alloc for lack of memory.
struct ThrowingAllocator {
  static constexpr bool kNeedFree = true;
  static void* Malloc(std::size_t size) { return Realloc(nullptr, 0, size); }
  static void* Realloc(void* block, std::size_t, std::size_t size) {
    if (size == 0) {
      std::free(block);
      return nullptr;
    }
    void* const resized = std::realloc(block, size);
    if (!resized) throw std::bad_alloc();
    return resized;
  }
  static void Free(void* block) { std::free(block); }
};

}  // namespace veltrad::formats
