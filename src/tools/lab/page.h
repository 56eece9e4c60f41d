// SPDX-License-Identifier: Apache-2.0
// The lab's live page.
#pragma once

#include <string>
#include <vector>

namespace veltrad::lab {

struct Arrivals;

// A page with the addresses of the servers, one per line, and the newest arrivals. It reloads itself every
// two seconds.
std::string livePage(const std::vector<std::string>& addresses, Arrivals& arrivals);

}  // namespace veltrad::lab
