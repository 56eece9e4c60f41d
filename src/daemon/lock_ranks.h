// SPDX-License-Identifier: Apache-2.0
// The places of this room's locks in the lock order (base/mutex.h).
#pragma once

#include "base/mutex.h"

#define SESSION_LIST_LOCK LOCK_OF_RANK(10)
#define STOREBAG_CACHE_LOCK LOCK_OF_RANK(20)
#define FAMILIES_LOCK LOCK_OF_RANK(30)
