// SPDX-License-Identifier: Apache-2.0
// The places of this room's locks in the lock order (base/mutex.h).
#pragma once

#include "base/mutex.h"

// Below all levels, because the owner's decision is passed to all sessions under it.
#define OWNER_LOCK                                  \
  ACQUIRED_AFTER(::veltrad::lock_order::above0)     \
  ACQUIRED_BEFORE(::veltrad::lock_order::below10) { \
    static_cast<::veltrad::LockRank>(5)             \
  }
#define SESSION_LIST_LOCK LOCK_OF_RANK(10)
#define STOREBAG_CACHE_LOCK LOCK_OF_RANK(20)
#define FAMILIES_LOCK LOCK_OF_RANK(30)
