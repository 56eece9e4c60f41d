// SPDX-License-Identifier: Apache-2.0
// A JSON Schema of storebags, for editors.
#pragma once

#include "base/value.h"

namespace veltrad::storebag {

// Draft 07, made from the tables that the daemon reads storebags with. Every object is closed.
Dictionary schemaOfStorebags();

}  // namespace veltrad::storebag
