// SPDX-License-Identifier: Apache-2.0
// The errno values that count as shortages.
#pragma once

#include <cerrno>

namespace veltrad::platform {

// True if there was no descriptor or memory, or a device failed: an error of this attempt, which must not be
// cached.
constexpr bool isShortage(int error) {
  return error == EMFILE || error == ENFILE || error == ENOMEM || error == EAGAIN || error == EIO ||
         error == ENOBUFS;
}

}  // namespace veltrad::platform
