// SPDX-License-Identifier: Apache-2.0
// Writes the form of Markdown that both the pages under docs and the manual pages are made from.
#pragma once

#include <string>
#include <string_view>

namespace veltrad::reference {

// Text in which no character has a meaning, except that what stands between backquotes remains code.
std::string escaped(std::string_view text);
// Help as programs print it: indented lines become blocks of code, the others paragraphs.
std::string prose(std::string_view text);
// Ends with a full stop, unless it is empty or ends a sentence already.
std::string sentence(std::string text);

}  // namespace veltrad::reference
