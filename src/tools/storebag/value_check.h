// SPDX-License-Identifier: Apache-2.0
// Compares one value with its key's row in the tables.
#pragma once

#include <string>

#include "config/key_table.h"
#include "storebag/lint_sink.h"

namespace veltrad::storebag {

// `at` is the key's. `lab`: as in LintOptions.
void checkValue(LintSink& sink, bool lab, const Spot& at, const config::Key& key, const Value& value);

// The name of a type with its article: "a text".
const char* typeText(config::KeyType type);
// The range that has a meaning: " from 0 to 1"; empty if the key has none.
std::string rangeText(const config::Key& key);
// The range that tools go by.
const config::Range& sensibleRange(const config::Key& key);
bool isBounded(const config::Range& range);

}  // namespace veltrad::storebag
