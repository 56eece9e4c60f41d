// SPDX-License-Identifier: Apache-2.0
// Parses KEY=VALUE.
#include "tools/key_value.h"

#include <fmt/format.h>

#include "base/text.h"
#include "formats/json.h"

namespace veltrad::tools {
namespace {

bool isDigit(char c) {
  return c >= '0' && c <= '9';
}

Value valueOf(std::string_view text) {
  if (text == "true") return Value(true);
  if (text == "false") return Value(false);
  if (text.empty() || !isDigit(text.back()) || !(isDigit(text.front()) || text.front() == '-'))
    return Value(text);
  const auto number = formats::parseJSON(text);
  return number && number.value().isNumber() ? number.value() : Value(text);
}

}  // namespace

Result<Dictionary::Entry, std::string> parseKeyValue(std::string_view text) {
  if (!isUTF8(text)) return Failure{fmt::format("\"{}\": expected UTF-8", escapedForLog(text))};
  const auto equals = text.find('=');
  if (equals == std::string_view::npos || equals == 0) {
    return Failure{fmt::format("\"{}\": expected KEY=VALUE", escapedForLog(text))};
  }
  return Dictionary::Entry(std::string(text.substr(0, equals)), valueOf(text.substr(equals + 1)));
}

Result<Dictionary, std::string> parseKeyValues(const std::vector<std::string>& texts) {
  std::vector<Dictionary::Entry> entries;
  for (const std::string& text : texts) {
    auto entry = parseKeyValue(text);
    if (!entry) return Failure{entry.error()};
    entries.push_back(std::move(entry).value());
  }
  return Dictionary::fromEntries(std::move(entries));
}

}  // namespace veltrad::tools
