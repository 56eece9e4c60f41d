// SPDX-License-Identifier: Apache-2.0
// The functions of text.h that need Unicode's tables, in a separate file because libveltra does not need
// them.
#include <utf8proc.h>

#include <algorithm>

#include "base/text.h"

namespace veltrad {

std::string lowerCase(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size();) {
    const UTF8Character character = characterAt(text, i);
    if (character.length <= 1) {
      const char c = text[i++];
      out += c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
      continue;
    }
    appendUTF8(out, static_cast<char32_t>(utf8proc_tolower(static_cast<utf8proc_int32_t>(character.code))));
    i += character.length;
  }
  return out;
}

bool equalIgnoringCase(std::string_view a, std::string_view b) {
  if (!isASCII(a) || !isASCII(b)) return lowerCase(a) == lowerCase(b);
  // Most texts are ASCII, for which no copies are needed.
  const auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; };
  return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                    [lower](char x, char y) { return lower(x) == lower(y); });
}

bool containsIgnoringCase(std::string_view text, std::string_view part) {
  return lowerCase(text).find(lowerCase(part)) != std::string::npos;
}

}  // namespace veltrad
