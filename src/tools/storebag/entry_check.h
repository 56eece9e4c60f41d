// SPDX-License-Identifier: Apache-2.0
// Compares client entries with one another, and filters with one another.
#pragma once

#include "base/value.h"
#include "storebag/lint_sink.h"

namespace veltrad::storebag {

// `at` is the key's of the array. Elements that are no dictionaries are passed over.
void checkEntries(LintSink& sink, const Spot& at, const Array& entries);
void checkFilters(LintSink& sink, const Spot& at, const Array& filters);
void checkConsent(LintSink& sink, const Spot& at, const Dictionary& entry);

}  // namespace veltrad::storebag
