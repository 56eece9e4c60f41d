// SPDX-License-Identifier: Apache-2.0
// Parses envelopes of events, and extracts the fields of an event that have columns in the tables.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::gateway {

// What no column takes is refused at the router. In bytes.
inline constexpr std::size_t kMostIdentifierBytes = 1'024;
inline constexpr std::size_t kMostKeyBytes = 256;

struct Envelope {
  std::string clientID;
  // Dictionaries of texts, finite numbers and booleans.
  std::vector<Dictionary> events;
};

// The gateway and the drain read envelopes with this function, so that what was accepted can be stored. The
// error is one line for people.
Result<Envelope, std::string> parseEnvelope(std::string text);

// Absent where the event has no such field or one of another type.
struct EventColumns {
  std::optional<std::string> sender;
  // A number, which internal builds send, becomes its text.
  std::optional<std::string> sessionID;
  // The identifiers that the session's combined identifier consists of, the root's first.
  std::vector<std::string> sessionPath;
  std::optional<std::int32_t> category;
  std::optional<std::int32_t> type;
  std::optional<std::int32_t> eventNumber;
  // Seconds since 1970, within the years 1970 to 2100.
  std::optional<double> happened;
};
EventColumns columnsOf(const Dictionary& event);

// Seconds since 1970 as a column takes them: within the years 1970 to 2100, else absent.
std::optional<double> columnTime(std::optional<double> seconds);

}  // namespace veltrad::gateway
