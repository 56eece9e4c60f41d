// SPDX-License-Identifier: Apache-2.0
// Lays out a storebag that is written as JSON.
#pragma once

#include <string>
#include <string_view>

namespace veltrad::storebag {

// `text` is one that parseJSONWithComments takes. Keys get the order of the tables; unknown ones follow in
// their own. Comments stay with what they stand above or behind. What the author wrote on one line stays
// there if it fits into 100 columns. The result of a result is the same.
std::string laidOut(std::string_view text);

}  // namespace veltrad::storebag
