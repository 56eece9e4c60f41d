// A copy of a file for the daemon, which takes none that others serve. The caller's thread.
#pragma once

#include <sys/types.h>

#include "base/file_descriptor.h"

namespace veltrad::client {

// Up to here a copy stays in memory, sealed; a larger one is a file without a name in TMPDIR, or in /tmp.
inline constexpr off_t kMostCopiedInMemory = 8 << 20;

// The `size` bytes of `file`. Not open: they cannot be had or kept, and errno says why; ESTALE: the file
// ended before.
FileDescriptor copyOfFile(int file, off_t size);

}  // namespace veltrad::client
