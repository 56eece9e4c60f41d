// SPDX-License-Identifier: Apache-2.0
// The lock file that allows one daemon for each root. One thread at a time.
#pragma once

#include <string>

#include "base/file_descriptor.h"
#include "base/result.h"
#include "platform/place.h"

namespace veltrad::platform {

struct LockRefusal {
  bool held = false;        // another process holds it; else it is out of reach
  std::string description;  // "process 12 holds /run/veltrad/lock", "/run/veltrad/lock: Permission denied"
};

// Makes the file where it is missing. Held until the descriptor is closed.
Result<FileDescriptor, LockRefusal> takeDaemonLock(const std::string& path,
                                                   Ownership ownership = Ownership::own);

}  // namespace veltrad::platform
