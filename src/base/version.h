// SPDX-License-Identifier: Apache-2.0
// The version of all programs and of the library, "8.0".
#pragma once

namespace veltrad {

extern const char* const kVersion;

// 2025-01-01, in seconds since 1970: before this release. A clock that shows an earlier time is wrong.
inline constexpr double kEarliestTime = 1'735'689'600;

}  // namespace veltrad
