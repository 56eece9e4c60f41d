// SPDX-License-Identifier: Apache-2.0
// Texts in pages and XML files.
#pragma once

#include <string>
#include <string_view>

namespace veltrad::tools {

// What others write is never markup, in an element or between double quotes.
std::string escapedForMarkup(std::string_view text);

}  // namespace veltrad::tools
