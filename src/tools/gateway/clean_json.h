// SPDX-License-Identifier: Apache-2.0
// Parses JSON of devices and restricts it to values that the database can store.
#pragma once

#include <cstddef>
#include <string>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::gateway {

// 16 MiB of text can hold millions of values, each of which takes from 40 to 150 bytes and a microsecond. A
// device posts 4,096 events at most, of some thirty.
inline constexpr std::size_t kMostValues = 500'000;

// The text with escapes that name no character of a database (NUL, a surrogate without its other half)
// replaced by U+FFFD.
std::string withWholeCharacters(std::string text);

// Parses such a text. In the result there is no NUL, and nothing but dictionaries, arrays, texts, finite
// numbers and booleans; an entry that is null is left out. The error is one line. A text that is not UTF-8,
// or has more values than the bound, is an error.
Result<Value, std::string> parseCleanJSON(std::string text);

}  // namespace veltrad::gateway
