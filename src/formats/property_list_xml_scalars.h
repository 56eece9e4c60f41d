// The texts of XML property lists' leaf elements: numbers, dates. Locale plays no part. Any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"

namespace veltrad::formats::xml_property_list {

std::string_view withoutBlanks(std::string_view text);

// Blanks around a number or date are ignored. Nothing: the text is none.
// Decimal or 0x and hexadecimal, with a sign or without, within 64 bits of either kind.
std::optional<Value> parseInteger(std::string_view text);
// Decimal with or without exponent, or nan, inf, infinity in any letter case; a sign or none.
std::optional<double> parseReal(std::string_view text);
// YYYY-MM-DDTHH:MM:SSZ
std::optional<Date> parseDate(std::string_view text);
// Whole seconds, rounded down; what lies outside the years 0 to 9999 becomes the nearest second inside.
std::string dateText(Date date);

}  // namespace veltrad::formats::xml_property_list
