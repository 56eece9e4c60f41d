// SPDX-License-Identifier: Apache-2.0
// Reads JSON that a device has sent, of which the database must be able to take everything.
#pragma once

#include <string>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::gateway {

// The text with escapes that name no character of a database (NUL, a surrogate without its other half)
// replaced by U+FFFD.
std::string withWholeCharacters(std::string text);

// Parses such a text. In the result there is no NUL, and nothing but dictionaries, arrays, texts, finite
// numbers and booleans; an entry that is null is left out. The error is one line. A text that is not UTF-8 is
// an error.
Result<Value, std::string> parseCleanJSON(std::string text);

}  // namespace veltrad::gateway
