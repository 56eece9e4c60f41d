// SPDX-License-Identifier: Apache-2.0
// The only file that is compiled again when the version changes.
#include "base/version.h"

namespace veltrad {

const char* const kVersion = VELTRA_VERSION;

}  // namespace veltrad
