// SPDX-License-Identifier: Apache-2.0
// The places of this room's locks in the lock order (base/mutex.h).
#pragma once

#include "base/mutex.h"

#define FLUSH_COUNTERS_LOCK LOCK_OF_RANK(40)
#define SESSION_LOCK LOCK_OF_RANK(50)
