// Where the locks of this room stand in the order of all (base/mutex.h).
#pragma once

#include "base/mutex.h"

#define FLUSH_COUNTERS_LOCK LOCK_OF_RANK(40)
#define SESSION_LOCK LOCK_OF_RANK(50)
