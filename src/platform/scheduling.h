// Scheduling class, heaps and limits of the process. Main thread, before any other thread exists: later
// threads inherit.
#pragma once

namespace veltrad::platform {

// Work that somebody awaits, but not at once: nice 5 at least, I/O in the lower half of the best-effort
// class.
void takeUtilitySchedulingClass();
// Two heaps for all threads instead of eight a core: a daemon of many small threads keeps its memory small.
void shareHeaps();
// What the heaps keep for later goes back to the system; costs a walk over them.
void returnFreeMemory();
// The soft limit on descriptors up to the hard one.
void raiseDescriptorLimit();

}  // namespace veltrad::platform
