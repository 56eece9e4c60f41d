// SPDX-License-Identifier: Apache-2.0
// Replaces the allocator of the C library.
#include "fakes/scarce_memory.h"

#include <cerrno>

#ifndef __has_feature
#define __has_feature(feature) 0  // GCC
#endif

namespace {
thread_local bool memoryIsScarce = false;
thread_local bool failsOnce = false;
thread_local bool hasFailedAlready = false;
thread_local std::size_t allocationsLeft = 0;
}  // namespace

#if !__has_feature(address_sanitizer) && !__has_feature(thread_sanitizer)

namespace {
bool allocationFails() {
  if (!memoryIsScarce || (hasFailedAlready && failsOnce)) return false;
  if (allocationsLeft > 0) {
    --allocationsLeft;
    return false;
  }
  hasFailedAlready = true;
  errno = ENOMEM;
  return true;
}
}  // namespace

extern "C" {
void* __libc_malloc(std::size_t size);
void* __libc_calloc(std::size_t count, std::size_t size);
void* __libc_realloc(void* block, std::size_t size);

void* malloc(std::size_t size) {
  return allocationFails() ? nullptr : __libc_malloc(size);
}
void* calloc(std::size_t count, std::size_t size) {
  return allocationFails() ? nullptr : __libc_calloc(count, size);
}
void* realloc(void* block, std::size_t size) {
  return size > 0 && allocationFails() ? nullptr : __libc_realloc(block, size);
}
}

#endif

namespace veltrad {

ScarceMemory::ScarceMemory(std::size_t granted, bool once) {
  allocationsLeft = granted;
  failsOnce = once;
  hasFailedAlready = false;
  memoryIsScarce = true;
}
ScarceMemory::~ScarceMemory() {
  memoryIsScarce = false;
}
bool ScarceMemory::hasFailed() const {
  return hasFailedAlready;
}

}  // namespace veltrad
