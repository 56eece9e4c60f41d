// SPDX-License-Identifier: Apache-2.0
// Lays out a storebag that is written as JSON.
#pragma once

#include <string>
#include <string_view>

namespace veltrad::storebag {

// `text` is one that parseJSONWithComments takes. Keys get the order of the tables; unknown ones follow in
// their own. A comment stays with the line below it or, at the end of a line, with that line. Values on one
// line stay on one line if they fit into 100 columns. Formatting twice gives the same result.
std::string laidOut(std::string_view text);

}  // namespace veltrad::storebag
