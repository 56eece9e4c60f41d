// What a storebag would do wrong, from its content alone. Pure; any thread.
#pragma once

#include <string>
#include <vector>

#include "base/value.h"

namespace veltrad::storebag {

// One line for each finding, with the place first ("release.httppost.clients[0]: …"), in the order of the
// storebag's keys; empty when there is nothing to say. The names of keys are those that the daemon reads.
std::vector<std::string> lintStorebag(const Dictionary& storebag);

}  // namespace veltrad::storebag
