// KEY=VALUE of the command line. Pure functions; any thread.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::ctl {

// Values that read as JSON numbers are numbers ("12", "-0.5"; "007" is none), true and false are booleans,
// everything else is a text. The failure says in one line what was expected.
Result<Dictionary::Entry, std::string> parseKeyValue(std::string_view text);
// Of equal keys the last one counts.
Result<Dictionary, std::string> parseKeyValues(const std::vector<std::string>& texts);

}  // namespace veltrad::ctl
