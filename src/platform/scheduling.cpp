// SPDX-License-Identifier: Apache-2.0
// Scheduling class, heaps and limits. Failures are ignored, because no user would notice them.
#include "platform/scheduling.h"

#include <malloc.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>

namespace veltrad::platform {

namespace {
constexpr int kUtilityNice = 5;
constexpr int kIOPriorityWhoProcess = 1;
constexpr int kIOPriorityBestEffort = 2 << 13;  // the level, 0 to 7, is in the lower bits
constexpr int kUtilityIOLevel = 6;
}  // namespace

void takeUtilitySchedulingClass() {
  errno = 0;
  const int now = getpriority(PRIO_PROCESS, 0);
  if (errno == 0 && now < kUtilityNice) setpriority(PRIO_PROCESS, 0, kUtilityNice);
  syscall(SYS_ioprio_set, kIOPriorityWhoProcess, 0, kIOPriorityBestEffort | kUtilityIOLevel);
}

void shareHeaps() {
  mallopt(M_ARENA_MAX, 2);
  // Large blocks are returned when they are freed; otherwise glibc would raise the threshold with each.
  mallopt(M_MMAP_THRESHOLD, 256 << 10);
  // What a post needs is freed after each post; returning it each time would cost a page fault for each page.
  mallopt(M_TRIM_THRESHOLD, 1 << 20);
}

void returnFreeMemory() {
  malloc_trim(0);
}

void raiseDescriptorLimit() {
  struct rlimit limit {};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_cur == limit.rlim_max) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

}  // namespace veltrad::platform
