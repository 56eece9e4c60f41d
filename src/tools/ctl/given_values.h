// Values that a user gives as JSON, and what is said of them. Pure functions; any thread.
#pragma once

#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::ctl {

// "an integer", "an object".
const char* typeName(const Value& value);
// The C interface takes keys that end at their first NUL.
bool hasUnsendableKey(const Value& value);
// An array of log data. The failure says in one line what is wrong and what was expected.
Result<Array, std::string> parseLogData(std::string_view text);

}  // namespace veltrad::ctl
