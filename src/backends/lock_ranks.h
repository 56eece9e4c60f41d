// Where the locks of this room stand in the order of all (base/mutex.h).
#pragma once

#include "base/mutex.h"

#define BACKEND_LOCK LOCK_OF_RANK(60)
