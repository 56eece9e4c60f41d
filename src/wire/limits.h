// SPDX-License-Identifier: Apache-2.0
// The limits of frames, the same for both ends of the socket.
#pragma once

#include "base/property_list.h"

namespace veltrad::wire {

// Bytes of a frame's body, and of a large call's, which carries log data.
inline constexpr std::size_t kFrameBodyLimit = 1u << 20;
inline constexpr std::size_t kLargeFrameBodyLimit = 16u << 20;

// Objects in a call's body, as objectsIn() counts them, and nesting.
inline constexpr std::size_t kMostCallObjects = 100'000;
inline constexpr int kMostFrameDepth = 64;
// Objects in the daemon's frames: it adds some to a client's payload.
inline constexpr std::size_t kMostDaemonObjects = kMostCallObjects + 1'000;
// Memory for the values of one call.
inline constexpr std::size_t kMostCallMemory = 8u << 20;

// The library's limits when it reads a frame: whatever the daemon may write.
inline constexpr PropertyListLimits kDaemonFrameLimits{kFrameBodyLimit, kMostFrameDepth, kMostDaemonObjects,
                                                       2 * kMostCallMemory};

}  // namespace veltrad::wire
