// SPDX-License-Identifier: Apache-2.0
// "Did you mean": finds the known name that a misspelt one comes closest to.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace veltrad::storebag {

// Compares letters regardless of case. A name is close if a third of it, and at least one letter, is
// missing, added, wrong or exchanged with its neighbour; or if one of the two names contains the other.
// Nothing: none is close.
std::optional<std::string> closestName(std::string_view given, const std::vector<std::string>& known);
// Follows a name that is not known: ": did you mean "phone"?", or ": expected one of lamp, phone".
std::string mostLike(std::string_view given, const std::vector<std::string>& known);

}  // namespace veltrad::storebag
