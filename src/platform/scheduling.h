// SPDX-License-Identifier: Apache-2.0
// Scheduling class, heaps and limits of the process. To be set on the main thread before any other exists,
// because threads inherit them.
#pragma once

namespace veltrad::platform {

// At least nice 5, and I/O in the lower half of the best-effort class.
void takeUtilitySchedulingClass();
// Limits malloc to two heaps instead of eight for each core, which saves memory with many small threads.
void shareHeaps();
// Returns free memory to the system; takes time in proportion to the size of the heaps.
void returnFreeMemory();
// Raises the soft limit on descriptors to the hard one.
void raiseDescriptorLimit();

}  // namespace veltrad::platform
