// SPDX-License-Identifier: Apache-2.0
// Stands for a file of the room "config": it may include the rooms below, and with UPWARD defined includes
// one above.
#include "base/value.h"
#include "support/device_identity.h"

#ifdef UPWARD
#include "session/veltrad_session.h"
#endif
