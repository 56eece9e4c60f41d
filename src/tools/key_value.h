// SPDX-License-Identifier: Apache-2.0
// Parses KEY=VALUE arguments.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::tools {

// JSON numbers ("12", "-0.5", but not "007") become numbers, true and false booleans, everything else a text.
// The error is one line that says what was expected.
Result<Dictionary::Entry, std::string> parseKeyValue(std::string_view text);
// If a key is repeated, the last value counts.
Result<Dictionary, std::string> parseKeyValues(const std::vector<std::string>& texts);

}  // namespace veltrad::tools
