// SPDX-License-Identifier: Apache-2.0
// Escapes what begins markup.
#include "tools/markup.h"

namespace veltrad::tools {

std::string escapedForMarkup(std::string_view text) {
  constexpr std::string_view kSpecial = "&<>\"";
  constexpr const char* kEscapes[] = {"&amp;", "&lt;", "&gt;", "&quot;"};
  std::string escaped;
  for (const char c : text) {
    const std::size_t special = kSpecial.find(c);
    if (special == std::string_view::npos)
      escaped += c;
    else
      escaped += kEscapes[special];
  }
  return escaped;
}

}  // namespace veltrad::tools
