// SPDX-License-Identifier: Apache-2.0
// The place of this room's locks in the lock order (base/mutex.h).
#pragma once

#include "base/mutex.h"

#define BACKEND_LOCK LOCK_OF_RANK(60)
