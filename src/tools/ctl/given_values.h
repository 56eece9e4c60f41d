// SPDX-License-Identifier: Apache-2.0
// Values that a user gives as JSON.
#pragma once

#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::ctl {

// For example "an integer" or "an object".
const char* typeName(const Value& value);
// Whether a key contains NUL, which the C interface cannot pass.
bool hasUnsendableKey(const Value& value);
// Reads an array of log data. The error is one line that says what is wrong and what was expected.
Result<Array, std::string> parseLogData(std::string_view text);

}  // namespace veltrad::ctl
