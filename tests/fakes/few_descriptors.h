// SPDX-License-Identifier: Apache-2.0
// Takes the process's descriptors away for a while. One at a time, while no other thread needs any.
#pragma once

#include <sys/resource.h>
#include <unistd.h>

#include "base/file_descriptor.h"

namespace veltrad {

// Lets `free` further descriptors be opened until it goes.
class FewDescriptors {
 public:
  explicit FewDescriptors(unsigned free = 0) {
    ::getrlimit(RLIMIT_NOFILE, &_before);
    FileDescriptor next[4];
    for (auto& one : next) one.reset(::dup(STDIN_FILENO));
    const rlimit few{static_cast<rlim_t>(next[free].get()), _before.rlim_max};
    ::setrlimit(RLIMIT_NOFILE, &few);
  }
  ~FewDescriptors() { ::setrlimit(RLIMIT_NOFILE, &_before); }

 private:
  rlimit _before{};
};

}  // namespace veltrad
