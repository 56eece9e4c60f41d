// SPDX-License-Identifier: Apache-2.0
// Fields of the daemon's answers, for printing. A field that is absent or of another type reads as empty.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "base/value.h"

namespace veltrad::ctl {

// Safe on a terminal: control characters are escaped.
std::string textIn(const Dictionary& answer, const char* key, const char* otherwise = "");
std::int64_t numberIn(const Dictionary& answer, const char* key);
const Array& arrayIn(const Dictionary& answer, const char* key);
// The dictionaries in an array.
std::vector<const Dictionary*> dictionariesIn(const Dictionary& answer, const char* key);

}  // namespace veltrad::ctl
