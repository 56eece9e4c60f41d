// SPDX-License-Identifier: Apache-2.0
// Finds mistakes in the content of a storebag.
#pragma once

#include <string>
#include <vector>

#include "base/value.h"

namespace veltrad::storebag {

// Returns one line for each finding, which begins with the place ("release.httppost.clients[0]: …"), in the
// order of the storebag's keys.
std::vector<std::string> lintStorebag(const Dictionary& storebag);

}  // namespace veltrad::storebag
