// SPDX-License-Identifier: Apache-2.0
// Generates the function reference of libveltra(3) from the comments of its header.
#pragma once

#include <string>
#include <string_view>

namespace veltrad::reference {

// `header` is the text of a C header whose comments start at the beginning of a line. A comment of the form
// "---- TITLE ----" begins a section.
std::string pageOfHeader(std::string_view header);

}  // namespace veltrad::reference
