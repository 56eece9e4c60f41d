// The JSON envelope that is posted, and its readable copy. Plain functions; any thread.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "base/value.h"

namespace veltrad::backends {

// What JSON cannot carry is taken out of an event, in place: a date becomes its seconds since 1970 (-1.0 if
// not finite); lists, dictionaries, raw bytes and numbers that are not finite are removed, each with one
// warning line. Returns how many entries were removed.
std::size_t restrictEventForJSON(Dictionary& event);

// -1.0 in place of what JSON cannot express.
double finiteOrMinusOne(double seconds);

struct JSONMessage {
  std::string compact;
  std::optional<std::string> pretty;  // only where it was wanted
};

// {"postTime": seconds since 1970, "clientId": text, "events": [...]}. The events are restricted already.
// `postTime` that is not finite is written as -1.0.
JSONMessage makeJSONMessage(double postTime, const std::string& clientID, std::vector<Dictionary> events,
                            bool wantPretty);

}  // namespace veltrad::backends
