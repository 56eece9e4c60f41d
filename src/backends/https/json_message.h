// SPDX-License-Identifier: Apache-2.0
// Makes the JSON text that is posted, and its readable copy.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "base/value.h"

namespace veltrad::backends {

// JSON cannot represent numbers that are not finite.
double finiteOrMinusOne(double seconds);

// Changes an event in place so that JSON can represent it. A date becomes its seconds since 1970 (-1.0 if not
// finite). Lists, dictionaries, raw bytes and numbers that are not finite are removed, each with a warning
// line. Returns how many entries were removed.
std::size_t restrictEventForJSON(Dictionary& event);

// True if restrictEventForJSON would change nothing.
bool fitsJSON(const Dictionary& event);

struct JSONMessage {
  std::string compact;
  // Only if it was requested.
  std::optional<std::string> pretty;
};

// {"postTime": seconds since 1970, "clientId": text, "events": [...]}. The events have been restricted. A
// `postTime` that is not finite becomes -1.0. `expectedBytes` as for writeJSON.
JSONMessage makeJSONMessage(double postTime, const std::string& clientID, std::vector<Dictionary> events,
                            bool wantPretty, std::size_t expectedBytes = 0);

}  // namespace veltrad::backends
