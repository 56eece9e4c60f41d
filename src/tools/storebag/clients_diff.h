// SPDX-License-Identifier: Apache-2.0
// Compares two lists of client entries: which entries correspond, and which clients get another entry.
#pragma once

#include <vector>

#include "base/value.h"
#include "storebag/change.h"

namespace veltrad::storebag {

// `at` names section and back end.
void compareClients(const Array& before, const Array& now, const ChangePlace& at,
                    std::vector<Change>& changes);

}  // namespace veltrad::storebag
