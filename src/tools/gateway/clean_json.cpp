// SPDX-License-Identifier: Apache-2.0
// Replaces escapes in place, because U+FFFD takes as many characters as the replaced escape.
#include "gateway/clean_json.h"

#include <fmt/format.h>

#include <charconv>

#include "base/text.h"
#include "formats/json.h"

namespace veltrad::gateway {

namespace {

constexpr std::size_t kEscapeLength = 6;

// At least as many as there are, without parsing.
std::size_t valuesIn(std::string_view text) {
  std::size_t values = 1;
  bool inText = false;
  for (std::size_t at = 0; at < text.size(); ++at) {
    const char c = text[at];
    if (inText && c == '\\')
      ++at;
    else if (c == '"')
      inText = !inText;
    else if (!inText && (c == ',' || c == '[' || c == '{'))
      ++values;
  }
  return values;
}

// The number of the escape \uXXXX at `at`; -1 if there is none.
int escapedUnit(std::string_view text, std::size_t at) {
  if (at + kEscapeLength > text.size() || text[at] != '\\' || text[at + 1] != 'u') return -1;
  int unit = 0;
  const char* end = text.data() + at + kEscapeLength;
  const auto read = std::from_chars(text.data() + at + 2, end, unit, 16);
  return read.ec == std::errc() && read.ptr == end && unit >= 0 ? unit : -1;
}

bool isHighSurrogate(int unit) {
  return unit >= 0xd800 && unit < 0xdc00;
}
bool isLowSurrogate(int unit) {
  return unit >= 0xdc00 && unit < 0xe000;
}

}  // namespace

std::string withWholeCharacters(std::string text) {
  for (std::size_t at = text.find('\\'); at != std::string::npos; at = text.find('\\', at)) {
    const int unit = escapedUnit(text, at);
    if (unit < 0) {
      at += 2;
    } else if (isHighSurrogate(unit) && isLowSurrogate(escapedUnit(text, at + kEscapeLength))) {
      at += 2 * kEscapeLength;
    } else {
      if (unit == 0 || isHighSurrogate(unit) || isLowSurrogate(unit))
        text.replace(at, kEscapeLength, "\\ufffd");
      at += kEscapeLength;
    }
  }
  return text;
}

Result<Value, std::string> parseCleanJSON(std::string text) {
  if (!isUTF8(text)) return Failure{std::string("it is not UTF-8")};
  if (text.size() > kMostValues && valuesIn(text) > kMostValues)
    return Failure{fmt::format("it has more than {} values", kMostValues)};
  text = withWholeCharacters(std::move(text));
  auto value = formats::parseJSON(text);
  if (!value) return Failure{std::move(value.error().detail)};
  return std::move(value).value();
}

}  // namespace veltrad::gateway
