// What a frame may hold, the same for both ends of the socket. Constants; any thread.
#pragma once

#include "base/property_list.h"

namespace veltrad::wire {

inline constexpr std::size_t kFrameBodyLimit = 1u << 20;        // 1,048,576 bytes
inline constexpr std::size_t kLargeFrameBodyLimit = 16u << 20;  // of log data alone

// Of a frame's body: keys, values and containers, each where it stands (objectsIn()), and nesting.
inline constexpr std::size_t kMostCallObjects = 100'000;
inline constexpr int kMostFrameDepth = 64;
// The daemon adds to a client's payload: what it writes may have so many objects.
inline constexpr std::size_t kMostDaemonObjects = kMostCallObjects + 1'000;
// The values of one call, in memory.
inline constexpr std::size_t kMostCallMemory = 8u << 20;

// What the library reads of the daemon's frames: whatever the daemon may write.
inline constexpr PropertyListLimits kDaemonFrameLimits{kFrameBodyLimit, kMostFrameDepth, kMostDaemonObjects,
                                                       2 * kMostCallMemory};

}  // namespace veltrad::wire
