// SPDX-License-Identifier: Apache-2.0
// Defined here so that a change of the version recompiles only this file.
#include "base/version.h"

namespace veltrad {

const char* const kVersion = VELTRA_VERSION;

}  // namespace veltrad
