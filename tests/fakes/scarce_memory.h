// SPDX-License-Identifier: Apache-2.0
// Takes a thread's memory away for a while, that of the C libraries included. Not under a sanitizer, which
// has an allocator of its own: there nothing ever fails.
#pragma once

#include <cstddef>
#include <initializer_list>
#include <new>

namespace veltrad {

// Made and destroyed by the thread whose memory is scarce; one at a time.
class ScarceMemory {
 public:
  // The first `granted` allocations are made. The next one fails and, unless `once`, all further ones.
  ScarceMemory(std::size_t granted, bool once);
  ~ScarceMemory();
  ScarceMemory(const ScarceMemory&) = delete;
  ScarceMemory& operator=(const ScarceMemory&) = delete;
  bool hasFailed() const;
};

// Calls `test` again and again: it sets the scene, gives its argument what is to run short of memory, which
// may throw std::bad_alloc, and looks at what has become of the scene. Each turn another allocation fails,
// alone or with all further ones, until none does.
template <typename Test>
void forEachShortage(const Test& test) {
  for (const bool once : {true, false}) {
    bool failed = true;
    for (std::size_t granted = 0; failed; ++granted) {
      failed = false;
      test([&](const auto& step) {
        const ScarceMemory scarce(granted, once);
        try {
          step();
        } catch (const std::bad_alloc&) {
        }
        failed = failed || scarce.hasFailed();
      });
    }
  }
}

}  // namespace veltrad
