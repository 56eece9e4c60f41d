// SPDX-License-Identifier: Apache-2.0
// Detects whether the current process is a forked child of the process that made this object.
#pragma once

#include <sys/types.h>

namespace veltrad::client {

// Holds a page that the kernel empties in a forked child, so asking costs one read of memory. Any thread.
class ForkMark {
 public:
  ForkMark();
  ~ForkMark();
  ForkMark(const ForkMark&) = delete;

  // True in a process that was forked from the one that made this.
  bool forked() const;

 private:
  // Null if the kernel has no such pages; then the process IDs are compared.
  const volatile char* _page = nullptr;
  const pid_t _process;
};

}  // namespace veltrad::client
