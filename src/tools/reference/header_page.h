// SPDX-License-Identifier: Apache-2.0
// What libveltra(3) says about the functions, from the comments of their header.
#pragma once

#include <string>
#include <string_view>

namespace veltrad::reference {

// `header` is the text of a C header whose comments start at the beginning of a line. A comment of the form
// "---- TITLE ----" begins a section.
std::string pageOfHeader(std::string_view header);

}  // namespace veltrad::reference
