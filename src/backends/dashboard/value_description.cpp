// SPDX-License-Identifier: Apache-2.0
// Makes a value's text and counts its characters.
#include "backends/dashboard/value_description.h"

#include <algorithm>

namespace veltrad::backends {

namespace {
std::size_t charactersOf(std::string_view text) {
  const auto beginsCharacter = [](char c) { return (static_cast<unsigned char>(c) & 0xC0) != 0x80; };
  return static_cast<std::size_t>(std::count_if(text.begin(), text.end(), beginsCharacter));
}
}  // namespace

ValueDescription descriptionForObject(const Value& value) {
  ValueDescription description;
  description._text = value.asString();
  if (!description._text) description._made = value.toText().value_or("null");
  description._characters = charactersOf(description.text());
  return description;
}

}  // namespace veltrad::backends
