// SPDX-License-Identifier: Apache-2.0
// The tables as SQL: fleet/schema.sql, which CMake puts into the program.
#pragma once

namespace veltrad::gateway {

extern const char* const kSchema;

}  // namespace veltrad::gateway
