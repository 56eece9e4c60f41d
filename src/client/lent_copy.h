// SPDX-License-Identifier: Apache-2.0
// Copies a file for the daemon, which does not accept files of network or FUSE file systems.
#pragma once

#include <sys/types.h>

#include "base/file_descriptor.h"

namespace veltrad::client {

// A copy up to this size is a sealed memory file, a larger one an unnamed file in TMPDIR or /tmp.
inline constexpr off_t kMostCopiedInMemory = 8 << 20;

// A copy of the first `size` bytes of `file`. Not open on failure, with errno; ESTALE if the file is shorter.
FileDescriptor copyOfFile(int file, off_t size);

}  // namespace veltrad::client
