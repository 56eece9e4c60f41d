// SPDX-License-Identifier: Apache-2.0
// Restricts an event's fields to those that JSON can represent.
#pragma once

#include <cstddef>
#include <string>

#include "base/value.h"
#include "formats/json_text_writer.h"

namespace veltrad::backends {

// JSON cannot represent numbers that are not finite.
double finiteOrMinusOne(double seconds);

// Changes an event in place so that JSON can represent it. A date becomes its seconds since 1970 (-1.0 if not
// finite). Lists, dictionaries, raw bytes and numbers that are not finite are removed, each with a warning
// line. Returns how many entries were removed.
std::size_t restrictEventForJSON(Dictionary& event);

// True if restrictEventForJSON would change nothing.
bool fitsJSON(const Dictionary& event);

// Writes a field as restrictEventForJSON leaves it. False if it is left out.
bool writeField(formats::JSONTextWriter& writer, const std::string& key, const Value& value);

}  // namespace veltrad::backends
