// SPDX-License-Identifier: Apache-2.0
// The texts of numbers and dates in XML property lists, independent of the locale.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"

namespace veltrad::formats::xml_property_list {

// The parsers ignore blanks around the text, and return nothing if it is not valid.

// Decimal, or hexadecimal after 0x, with an optional sign; within 64 bits, signed or unsigned.
std::optional<Value> parseInteger(std::string_view text);
// Decimal with an optional exponent, or nan, inf or infinity in any letter case; with an optional sign.
std::optional<Value> parseReal(std::string_view text);
// YYYY-MM-DDTHH:MM:SSZ
std::optional<Value> parseDate(std::string_view text);
// Rounded down to whole seconds, and limited to the years 0 to 9999.
std::string dateText(Date date);

}  // namespace veltrad::formats::xml_property_list
